#include "keystrand/Registry.h"

#include "wire/KernelSocket.h"
#include "wire/RestrictedMode.h"

#include <algorithm>

namespace keystrand {

bool Registry::set(std::string_view name, std::span<const std::uint8_t> value) {
    if (name.empty() || name.size() > wire::kKernelMaxNameLength || value.size() > kMaxValueSize) {
        return false;
    }
    auto found = properties_.find(name);
    if (found == properties_.end()) {
        if (properties_.size() == kMaxProperties) {
            return false;
        }
        found = properties_.emplace(name, Property{}).first;
    }
    found->second.value.assign(value.begin(), value.end());
    found->second.generation = ++lastGeneration_;
    return true;
}

void Registry::announce(std::string_view name) {
    const auto found = properties_.find(name);
    if (found != properties_.end()) {
        ++found->second.announcements;
    }
}

std::vector<Registry::Record> Registry::records() const {
    std::vector<Record> all;
    for (const auto& [name, property] : properties_) {
        all.push_back({name, property.generation});
    }
    std::sort(all.begin(), all.end(), [](const Record& left, const Record& right) {
        return left.generation < right.generation;
    });
    return all;
}

bool Registry::forgetAnnouncements(const Record& record) {
    const auto found = properties_.find(record.name);
    if (found == properties_.end() || found->second.generation != record.generation) {
        return false;
    }
    found->second.announcements = 0;
    return true;
}

bool Registry::remove(std::string_view name) {
    const auto found = properties_.find(name);
    if (found == properties_.end()) {
        return false;
    }
    properties_.erase(found);
    return true;
}

const Registry::Property* Registry::find(std::string_view name) const {
    const auto found = properties_.find(name);
    return found == properties_.end() ? nullptr : &found->second;
}

std::optional<std::vector<std::uint8_t>> Registry::copy(std::string_view name) {
    const auto found = properties_.find(name);
    if (found == properties_.end()) {
        return std::nullopt;
    }
    Property& property = found->second;
    property.handedOut = property.generation;
    property.lastCopy = ++lastCopy_;
    if (property.announcements > 0) {
        --property.announcements;
    }
    return property.value;
}

std::optional<Registry::Record> Registry::acknowledge(std::string_view name) {
    const auto found = acknowledgedProperty(name);
    if (found == properties_.end()) {
        return std::nullopt;
    }
    const Property& property = found->second;
    // A record that nobody has seen, or whose event is still to come, would be lost.
    if (property.announcements > 0 || property.handedOut != property.generation) {
        return std::nullopt;
    }
    Record dropped{.name = found->first, .generation = property.generation};
    properties_.erase(found);
    return dropped;
}

Registry::Properties::iterator Registry::acknowledgedProperty(std::string_view name) {
    const auto exact = properties_.find(name);
    // A name that fills its payload may have been cut.
    if (exact != properties_.end() || name.size() < wire::rm::kNotificationAckPayloadSize) {
        return exact;
    }
    auto latest = properties_.end();
    for (auto it = properties_.lower_bound(name);
         it != properties_.end() && it->first.starts_with(name); ++it) {
        if (latest == properties_.end() || it->second.lastCopy > latest->second.lastCopy) {
            latest = it;
        }
    }
    return latest;
}

} // namespace keystrand
