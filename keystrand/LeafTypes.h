#pragma once

#include <cstdint>
#include <span>
#include <string_view>

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

} // namespace keystrand
