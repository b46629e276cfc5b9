#include "platform/fake/FakeAlarmEvent.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace platform {

FakeAlarmEvent::FakeAlarmEvent(FakeAlarmStore& store, const FakeClock& clock, EventQueue& queue)
    : store_(store), clock_(clock), queue_(queue) {}

void FakeAlarmEvent::set(std::string_view stream, std::string_view event,
                         const EventDictionary* dictionary) {
    const Name name(stream, event);
    queue_.drop(stream, event);
    const auto none = EventDictionary();
    const EventDictionary& values = dictionary == nullptr ? none : *dictionary;
    const auto date = values.find(kAlarmDateKey);
    if (date == values.end()) {
        store_.clear(name);
        registrations_.erase(name);
        return;
    }
    store_.save(name, date->second);
    registrations_.insert_or_assign(name, Registration{date->second});
    fireDue();
}

void FakeAlarmEvent::restore(std::string_view stream) {
    for (const auto& [name, date] : store_.all()) {
        if (name.first == stream) {
            registrations_.try_emplace(name, Registration{date});
        }
    }
    fireDue();
}

void FakeAlarmEvent::fireDue() {
    std::vector<std::pair<Date, Name>> due;
    for (auto& [name, registration] : registrations_) {
        if (!registration.fired && registration.date <= clock_.now()) {
            registration.fired = true;
            due.emplace_back(registration.date, name);
        }
    }
    std::sort(due.begin(), due.end());
    for (auto& [date, name] : due) {
        queue_.push({std::move(name.first), std::move(name.second)});
    }
}

void FakeAlarmEvent::delivered(const Event& event) {
    const auto found = registrations_.find(Name(event.stream, event.name));
    if (found != registrations_.end() && found->second.fired &&
        !queue_.holds(event.stream, event.name)) {
        store_.clear(found->first);
        registrations_.erase(found);
    }
}

std::optional<Date> FakeAlarmEvent::next() const {
    std::optional<Date> next;
    for (const auto& [name, registration] : registrations_) {
        if (!registration.fired && (!next || registration.date < *next)) {
            next = registration.date;
        }
    }
    return next;
}

} // namespace platform
