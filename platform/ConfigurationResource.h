#pragma once

#include "platform/Value.h"

#include <optional>
#include <string_view>

namespace platform {

/// What a component of the system was delivered with.
class ConfigurationResource {
  public:
    ConfigurationResource() = default;
    ConfigurationResource(const ConfigurationResource&) = delete;
    ConfigurationResource& operator=(const ConfigurationResource&) = delete;
    virtual ~ConfigurationResource() = default;

    /// The property list `name` of the component, when it is there and is a map.
    [[nodiscard]] virtual std::optional<ValueMap> load(std::string_view component,
                                                       std::string_view name) = 0;
};

} // namespace platform
