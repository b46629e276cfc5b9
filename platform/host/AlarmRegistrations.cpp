#include "platform/host/AlarmRegistrations.h"

#include <algorithm>

namespace platform {

void AlarmRegistrations::put(const Name& name, Date date) {
    registrations_.insert_or_assign(name, Registration{date});
}

void AlarmRegistrations::putIfAbsent(const Name& name, Date date) {
    registrations_.try_emplace(name, Registration{date});
}

std::vector<AlarmRegistrations::Name> AlarmRegistrations::takeDue(Date now) {
    std::vector<std::pair<Date, Name>> due;
    for (auto& [name, registration] : registrations_) {
        if (!registration.fired && registration.date <= now) {
            registration.fired = true;
            due.emplace_back(registration.date, name);
        }
    }
    std::sort(due.begin(), due.end());
    std::vector<Name> names;
    names.reserve(due.size());
    for (auto& [date, name] : due) {
        names.push_back(std::move(name));
    }
    return names;
}

bool AlarmRegistrations::take(const Name& name, Date date) {
    const auto found = registrations_.find(name);
    if (found == registrations_.end() || found->second.fired || found->second.date != date) {
        return false;
    }
    found->second.fired = true;
    return true;
}

bool AlarmRegistrations::hasFired(const Name& name) const {
    const auto found = registrations_.find(name);
    return found != registrations_.end() && found->second.fired;
}

std::optional<Date> AlarmRegistrations::next() const {
    std::optional<Date> next;
    for (const auto& [name, registration] : registrations_) {
        if (!registration.fired && (!next || registration.date < *next)) {
            next = registration.date;
        }
    }
    return next;
}

} // namespace platform
