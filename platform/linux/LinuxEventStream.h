#pragma once

#include "platform/EventStream.h"
#include "platform/SystemLog.h"
#include "platform/host/EventQueue.h"
#include "platform/linux/LinuxRunLoop.h"

#include <functional>
#include <memory>
#include <string_view>
#include <vector>

namespace platform {

/// The event streams of the process: one queue, emptied by the run loop, one event a turn.
class LinuxEventStream final : public EventStream {
  public:
    using Observer = std::function<void(const Event&)>;
    using HandlerObserver = std::function<void(std::string_view stream)>;

    LinuxEventStream(LinuxRunLoop& loop, SystemLog& log);

    void setHandler(std::string_view stream, Handler handler) override;

    /// Destroys every handler and what it holds.
    void clearHandlers() { queue_.clearHandlers(); }

    /// Queues an event. One on a stream without a handler is dropped with a log line when its turn
    /// comes.
    void post(Event event);

    /// Drops what is queued under this name and not delivered yet.
    void drop(std::string_view stream, std::string_view name);

    /// Whether events are waiting.
    [[nodiscard]] bool busy() const { return !queue_.empty(); }

    /// Whether an event of this name is waiting.
    [[nodiscard]] bool holds(std::string_view stream, std::string_view name) const {
        return queue_.holds(stream, name);
    }

    /// Each observer is called after each event's handler has returned.
    void addDeliveryObserver(Observer observer) { observers_.push_back(std::move(observer)); }

    /// Called after a stream has got its handler.
    void setHandlerObserver(HandlerObserver observer) { handlerSet_ = std::move(observer); }

  private:
    void deliverOne();

    SystemLog& log_;
    EventQueue queue_;
    std::vector<Observer> observers_;
    HandlerObserver handlerSet_;
    std::unique_ptr<RunLoopSource> delivery_;
};

} // namespace platform
