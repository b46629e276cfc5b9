#pragma once

#include "base/NotCopied.h"
#include "platform/Value.h"

#include <optional>
#include <string_view>

namespace platform {

/// What a component of the system was delivered with.
class ConfigurationResource : private base::NotCopied {
  public:
    virtual ~ConfigurationResource() = default;

    /// The property list `name` of the component, when it is there and is a map.
    [[nodiscard]] virtual std::optional<ValueMap> load(std::string_view component,
                                                       std::string_view name) = 0;
};

} // namespace platform
