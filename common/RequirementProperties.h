#pragma once

#include "KSTLib/Requirement.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace kst {

/// One property of the requirements of one type.
struct RequirementProperty {
    std::uint32_t id;
    /// kEveryType: the property is in the header.
    std::uint32_t type;
    /// From the start of the header.
    std::size_t offset;
    std::size_t length;
    /// The length that the enumeration gives; 0 leaves the property out.
    std::size_t enumeratedLength;
    /// The text of the check that a requirement has the property.
    const char* typeCheck;

    static constexpr std::uint32_t kEveryType = 0;

    /// Whether the type of `requirement` has the property.
    [[nodiscard]] bool belongsTo(const KSTRequirement* requirement) const {
        return type == kEveryType || type == requirement->type;
    }

    /// Whether the data of `requirement` have the whole property.
    [[nodiscard]] bool fitsIn(const KSTRequirement* requirement) const {
        return offset + length <= sizeof(KSTRequirement) + requirement->dataLength;
    }

    /// Whether the enumeration gives the property, and the data of `requirement` have what it
    /// gives of it.
    [[nodiscard]] bool isEnumeratedFor(const KSTRequirement* requirement) const {
        return enumeratedLength > 0 && belongsTo(requirement) &&
               offset + enumeratedLength <= sizeof(KSTRequirement) + requirement->dataLength;
    }

    [[nodiscard]] const std::uint8_t* in(const KSTRequirement* requirement) const {
        return reinterpret_cast<const std::uint8_t*>(requirement) + offset;
    }
};

/// All of them, in the order of the enumeration. A property that several types have is there
/// several times.
[[nodiscard]] std::span<const RequirementProperty> requirementProperties() noexcept;

} // namespace kst
