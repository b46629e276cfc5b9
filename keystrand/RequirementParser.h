#pragma once

#include "keystrand/Requirement.h"
#include "keystrand/TextParser.h"

#include <cstddef>
#include <optional>

namespace keystrand {

inline constexpr std::size_t kMaxRequirementDepth = 16;
/// What fits into the answer to a client beside the four bytes before it.
inline constexpr std::size_t kMaxRequirementWireSize = 4096 - 4;

/// Takes a requirement:
///
///     requirement = leaf | composite
///     composite   = ("all-of" | "any-of" | K "-of") "(" requirement { "," requirement } ")"
///     leaf        = type [ "(" option { "," option } ")" ]
///     option      = ("user" | "age" | "purpose" | "priority") "=" number | "once"
///
/// None, with the parser's error set, when something else is there, or when the requirement is too
/// deep or too large.
[[nodiscard]] std::optional<Requirement> parseRequirement(TextParser& parser);

} // namespace keystrand
