#pragma once

#include "base/NotCopied.h"
#include "platform/Value.h"

#include <string_view>

namespace platform {

/// What the administrator of this machine has set, by domain.
class UserDefaults : private base::NotCopied {
  public:
    virtual ~UserDefaults() = default;

    /// All that is set in the domain; empty when nothing is. Read anew on every call, as one state
    /// of it.
    [[nodiscard]] virtual ValueMap load(std::string_view domain) = 0;
};

} // namespace platform
