#include "platform/fake/FakeConfiguration.h"

#include <utility>

namespace platform {

FakeUserDefaults::FakeUserDefaults() = default;
FakeUserDefaults::~FakeUserDefaults() = default;

ValueMap FakeUserDefaults::load(std::string_view domain) {
    const auto found = domains_.find(domain);
    return found != domains_.end() ? found->second : ValueMap();
}

void FakeUserDefaults::set(std::string_view domain, std::string_view key, Value value) {
    domains_[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
}

void FakeUserDefaults::remove(std::string_view domain, std::string_view key) {
    domains_[std::string(domain)].erase(std::string(key));
}

FakeConfigurationResource::FakeConfigurationResource() = default;
FakeConfigurationResource::~FakeConfigurationResource() = default;

std::optional<ValueMap> FakeConfigurationResource::load(std::string_view component,
                                                        std::string_view name) {
    const auto entry = resources_.find({std::string(component), std::string(name)});
    return entry == resources_.end() ? std::nullopt : std::optional(entry->second);
}

void FakeConfigurationResource::put(std::string_view component, std::string_view name,
                                    ValueMap content) {
    resources_.insert_or_assign({std::string(component), std::string(name)}, std::move(content));
}

void FakeConfigurationResource::remove(std::string_view component, std::string_view name) {
    resources_.erase({std::string(component), std::string(name)});
}

} // namespace platform
