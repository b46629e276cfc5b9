#include "platform/fake/FakeServiceRegistry.h"

namespace platform {

ServiceHandle FakeServiceRegistry::findByPath(std::string_view path) {
    return kernel_.hasEntry() && path == kernel_.path ? hold() : kNoService;
}

ServiceHandle FakeServiceRegistry::findByClassName(std::string_view name) {
    return kernel_.hasEntry() && name == kernel_.className ? hold() : kNoService;
}

std::optional<std::vector<std::uint8_t>> FakeServiceRegistry::copyProperty(ServiceHandle entry,
                                                                           std::string_view name) {
    if (!kernel_.hasEntry() || pathOf(entry) != kernel_.path) {
        return std::nullopt;
    }
    kernel_.propertyReads.emplace_back(name);
    const auto found = kernel_.properties.find(name);
    return found == kernel_.properties.end() ? std::nullopt : std::optional(found->second);
}

void FakeServiceRegistry::release(ServiceHandle entry) {
    const auto found = entries_.find(entry);
    if (found != entries_.end() && --found->second.references == 0) {
        entries_.erase(found);
    }
}

std::size_t FakeServiceRegistry::liveReferences() const {
    std::size_t count = 0;
    for (const auto& [handle, entry] : entries_) {
        count += entry.references;
    }
    return count;
}

std::string FakeServiceRegistry::pathOf(ServiceHandle entry) const {
    const auto found = entries_.find(entry);
    return found == entries_.end() ? std::string() : found->second.path;
}

ServiceHandle FakeServiceRegistry::hold() {
    for (auto& [handle, entry] : entries_) {
        if (entry.path == kernel_.path) {
            ++entry.references;
            return handle;
        }
    }
    entries_.emplace(++lastHandle_, Entry{kernel_.path, 1});
    return lastHandle_;
}

} // namespace platform
