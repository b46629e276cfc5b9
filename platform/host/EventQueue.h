#pragma once

#include "platform/EventStream.h"

#include <deque>
#include <map>
#include <string>
#include <string_view>

namespace platform {

/// The one queue of a process over all its event streams: first in, first out, with a handler for
/// each stream. Main thread only.
class EventQueue {
  public:
    void setHandler(std::string_view stream, EventStream::Handler handler);

    /// Destroys every handler and what it holds.
    void clearHandlers();

    void push(Event event);

    /// Drops what is queued for this stream under this name.
    void drop(std::string_view stream, std::string_view name);

    [[nodiscard]] bool empty() const { return events_.empty(); }
    [[nodiscard]] bool holds(std::string_view stream, std::string_view name) const;

    /// Takes the oldest event out and hands it to its stream's handler. False when the stream has
    /// none; the event is then gone. The queue must not be empty. The handler may change the queue
    /// and the handlers, its own included.
    [[nodiscard]] bool deliverOne();

    /// The event that `deliverOne` will deliver next. The queue must not be empty.
    [[nodiscard]] const Event& front() const { return events_.front(); }

  private:
    std::deque<Event> events_;
    std::map<std::string, EventStream::Handler, std::less<>> handlers_;
};

} // namespace platform
