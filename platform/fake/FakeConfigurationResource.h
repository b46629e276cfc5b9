#pragma once

#include "platform/ConfigurationResource.h"

#include <map>
#include <string>
#include <utility>

namespace platform {

/// Configuration resources that a test puts, before anybody on another thread loads them.
class FakeConfigurationResource final : public ConfigurationResource {
  public:
    FakeConfigurationResource();
    ~FakeConfigurationResource() override;

    [[nodiscard]] std::optional<ValueMap> load(std::string_view component,
                                               std::string_view name) override;
    void put(std::string_view component, std::string_view name, ValueMap content);
    void remove(std::string_view component, std::string_view name);

  private:
    /// By component and name.
    std::map<std::pair<std::string, std::string>, ValueMap> resources_;
};

} // namespace platform
