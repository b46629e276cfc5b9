#include "platform/host/EventQueue.h"

#include <algorithm>
#include <utility>

namespace platform {

void EventQueue::setHandler(std::string_view stream, EventStream::Handler handler) {
    handlers_.insert_or_assign(std::string(stream), std::move(handler));
}

void EventQueue::clearHandlers() {
    // Out of the queue first, because what a handler holds may come back here when it goes.
    const auto handlers = std::exchange(handlers_, {});
}

void EventQueue::push(Event event) {
    events_.push_back(std::move(event));
}

void EventQueue::drop(std::string_view stream, std::string_view name) {
    std::erase_if(events_,
                  [&](const Event& event) { return event.stream == stream && event.name == name; });
}

bool EventQueue::holds(std::string_view stream, std::string_view name) const {
    return std::any_of(events_.begin(), events_.end(), [&](const Event& event) {
        return event.stream == stream && event.name == name;
    });
}

bool EventQueue::deliverOne() {
    const Event event = std::move(events_.front());
    events_.pop_front();
    const auto found = handlers_.find(event.stream);
    if (found == handlers_.end() || !found->second) {
        return false;
    }
    // A copy, because the handler may replace itself.
    const EventStream::Handler handler = found->second;
    handler(event);
    return true;
}

} // namespace platform
