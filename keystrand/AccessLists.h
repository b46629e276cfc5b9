#pragma once

#include "keystrand/PolicyRequirement.h"
#include "keystrand/PolicyTable.h"
#include "keystrand/TextParser.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace keystrand {

/// What an access-control list asks for: the name of a policy, or a requirement of its own.
using Constraint = std::variant<std::string, PolicyRequirement>;

/// The longest constraint, and the longest list, that is read.
inline constexpr std::size_t kMaxConstraintSize = 4096;

/// Takes a constraint:
///
///     constraint = "policy" name | requirement
///
/// None, with the parser's error set, when something else is there.
[[nodiscard]] std::optional<Constraint> parseConstraint(TextParser& parser);

/// The requirement that a constraint stands for; null for a policy that is not there. Valid as long
/// as both.
[[nodiscard]] const PolicyRequirement* resolve(const Constraint& constraint,
                                               const PolicyTable& policies);

/// One line of an access-control list.
struct AccessRule {
    std::string operation;
    Constraint constraint;
};

inline constexpr std::size_t kMaxAccessRules = 64;

/// Takes an access-control list of 1 to kMaxAccessRules rules:
///
///     list = { "allow" operation "=" constraint }
///
/// None, with the parser's error set, when something else is there or an operation is there twice.
[[nodiscard]] std::optional<std::vector<AccessRule>> parseAccessList(TextParser& parser);

/// Which credentials matter to a requirement: bit T stands for credentials of type T.
struct Characteristics {
    /// At least one leaf asks for it.
    std::uint32_t usable = 0;
    /// The requirement cannot be met without it.
    std::uint32_t indispensable = 0;

    bool operator==(const Characteristics&) const = default;
};

[[nodiscard]] Characteristics characteristicsOf(const PolicyRequirement& requirement);

} // namespace keystrand
