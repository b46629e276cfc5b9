#include "platform/fake/FakeAlarmEvent.h"

namespace platform {

FakeAlarmEvent::FakeAlarmEvent(FakeAlarmStore& store, Clock& clock, EventQueue& queue)
    : store_(store), clock_(clock), queue_(queue) {}

void FakeAlarmEvent::set(std::string_view stream, std::string_view event,
                         const EventDictionary* dictionary) {
    const Name name(stream, event);
    queue_.drop(stream, event);
    if (const auto date = alarmDateIn(dictionary)) {
        store_.save(name, *date);
        registrations_.put(name, *date);
        fireDue();
    } else {
        cancel(name);
    }
}

void FakeAlarmEvent::cancel(const Name& name) {
    store_.clear(name);
    registrations_.erase(name);
}

void FakeAlarmEvent::restore(std::string_view stream) {
    for (const auto& [name, date] : store_.all()) {
        if (name.first == stream) {
            registrations_.putIfAbsent(name, date);
        }
    }
    fireDue();
}

void FakeAlarmEvent::fireDue() {
    for (auto& [stream, event] : registrations_.takeDue(clock_.now())) {
        queue_.push({stream, event});
    }
}

void FakeAlarmEvent::delivered(const Event& event) {
    const Name name(event.stream, event.name);
    if (registrations_.hasFired(name) && !queue_.holds(event.stream, event.name)) {
        cancel(name);
    }
}

} // namespace platform
