#pragma once

#include "base/NotCopied.h"

#include <optional>
#include <string>

namespace platform {

/// Which system this is.
class SystemVersion : private base::NotCopied {
  public:
    virtual ~SystemVersion() = default;

    /// The build of the system, or none when it is not known.
    [[nodiscard]] virtual std::optional<std::string> build() = 0;

    /// The product's name, or none when it is not known.
    [[nodiscard]] virtual std::optional<std::string> product() = 0;
};

} // namespace platform
