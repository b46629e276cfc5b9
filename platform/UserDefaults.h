#pragma once

#include "platform/Value.h"

#include <optional>
#include <string_view>

namespace platform {

/// What the administrator of this machine has set, by domain and key.
class UserDefaults {
  public:
    UserDefaults() = default;
    UserDefaults(const UserDefaults&) = delete;
    UserDefaults& operator=(const UserDefaults&) = delete;
    virtual ~UserDefaults() = default;

    /// The value, or none when nothing is set. Read anew on every call.
    [[nodiscard]] virtual std::optional<Value> value(std::string_view domain,
                                                     std::string_view key) = 0;
};

} // namespace platform
