#pragma once

#include "keystrand/TextParser.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand {

/// One kind of leaf of a requirement.
struct LeafType {
    /// No credential has this type.
    static constexpr std::uint32_t kNoCredential = 0;

    /// As policies name it.
    std::string_view name;
    std::uint32_t requirement;
    /// The type of credential that meets it, or kNoCredential.
    std::uint32_t credential;
    /// The bytes of data behind the header of the requirement.
    std::uint32_t dataSize;
};

[[nodiscard]] std::span<const LeafType> leafTypes();

/// Null when there is none of that name.
[[nodiscard]] const LeafType* findLeafType(std::string_view name);

/// The word for what is met without any credential.
inline constexpr std::string_view kAlways = "always";

/// What a policy asks for: a leaf, which one credential meets, a number of its children, or
/// nothing.
struct PolicyRequirement {
    enum class Kind { leaf, allOf, anyOf, someOf, always };

    Kind kind = Kind::leaf;

    /// Of a leaf. What is not given is not asked for.
    const LeafType* type = nullptr;
    std::optional<std::uint32_t> user;
    std::optional<std::uint32_t> maxAge;
    std::optional<std::uint32_t> purpose;
    std::uint32_t priority = 0;
    /// The credential that meets the leaf is used up by it.
    bool once = false;

    /// At least one of allOf, anyOf and someOf.
    std::vector<PolicyRequirement> children;
    /// How many of the children are asked for, 1 to all of them; 0 of always.
    std::uint32_t needed = 0;
};

/// The bytes of the requirement on the wire.
[[nodiscard]] std::size_t wireSize(const PolicyRequirement& requirement);

/// The requirement as policies write it, on one line.
[[nodiscard]] std::string toText(const PolicyRequirement& requirement);

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
[[nodiscard]] std::optional<PolicyRequirement> parseRequirement(TextParser& parser);

} // namespace keystrand
