#pragma once

#include "platform/EventStream.h"
#include "platform/host/EventQueue.h"

#include <functional>
#include <string_view>
#include <utility>

namespace platform {

/// The streams of a process over the queue that its host fills.
class FakeEventStream final : public EventStream {
  public:
    using HandlerObserver = std::function<void(std::string_view stream)>;

    explicit FakeEventStream(EventQueue& queue) : queue_(queue) {}

    void setHandler(std::string_view stream, Handler handler) override {
        queue_.setHandler(stream, std::move(handler));
        if (handlerSet_) {
            handlerSet_(stream);
        }
    }

    /// Called after a stream has got its handler.
    void setHandlerObserver(HandlerObserver observer) { handlerSet_ = std::move(observer); }

  private:
    EventQueue& queue_;
    HandlerObserver handlerSet_;
};

} // namespace platform
