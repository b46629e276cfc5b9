#pragma once

#include "platform/Result.h"
#include "platform/Value.h"

#include <string_view>

namespace platform {

/// What JSON::read does.
[[nodiscard]] Result<Value> readJSON(std::string_view text);

} // namespace platform
