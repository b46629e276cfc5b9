#include "platform/fake/FakeConfiguration.h"

namespace platform {

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
