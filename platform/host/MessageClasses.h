#pragma once

#include "platform/MessageClass.h"

#include <span>
#include <string_view>

namespace platform {

/// Whether the line begins as the pattern says.
[[nodiscard]] bool isOfPattern(std::string_view line, std::string_view pattern);

/// The identifier of the first class that the line is of; empty when it is of none.
[[nodiscard]] std::string_view messageIdOf(std::string_view line,
                                           std::span<const MessageClass> classes);

} // namespace platform
