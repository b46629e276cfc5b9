#pragma once

#include "platform/ConfigurationResource.h"

#include <map>
#include <string>
#include <utility>

namespace platform {

/// Configuration resources that a test puts, before anybody on another thread loads them.
class FakeConfigurationResource final : public ConfigurationResource {
  public:
    [[nodiscard]] std::optional<ValueMap> load(std::string_view component,
                                               std::string_view name) override {
        const auto entry = resources_.find({std::string(component), std::string(name)});
        return entry == resources_.end() ? std::nullopt : std::optional(entry->second);
    }

    void put(std::string_view component, std::string_view name, ValueMap content) {
        resources_.insert_or_assign({std::string(component), std::string(name)},
                                    std::move(content));
    }

    void remove(std::string_view component, std::string_view name) {
        resources_.erase({std::string(component), std::string(name)});
    }

  private:
    /// By component and name.
    std::map<std::pair<std::string, std::string>, ValueMap> resources_;
};

} // namespace platform
