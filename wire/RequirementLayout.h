#pragma once

#include "KSTLib/Requirement.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

/// Where the parts of a requirement are in memory. All offsets are from the start of its header.
namespace wire {

/// What a slot for a child takes, aligned or not.
inline constexpr std::size_t kChildSize = sizeof(KSTRequirement*);
static_assert(kChildSize == 8, "a dataLength on the wire says so");
static_assert(sizeof(KSTRequirement) == 16);

struct CompositeLayout {
    std::size_t countOffset;
    std::size_t childrenOffset;
};

inline constexpr CompositeLayout kListLayout{16, 20};
inline constexpr CompositeLayout kKofNLayout{20, 24};
inline constexpr CompositeLayout kInMemoryLayout{33, 37};

/// Null for a leaf and for a type that does not exist.
[[nodiscard]] constexpr const CompositeLayout* findCompositeLayout(std::uint32_t type) noexcept {
    switch (type) {
    case kKSTRequirementTypeAnd:
    case kKSTRequirementTypeOr:
        return &kListLayout;
    case kKSTRequirementTypeKofN:
        return &kKofNLayout;
    case kKSTRequirementTypeInMemory:
        return &kInMemoryLayout;
    default:
        return nullptr;
    }
}

/// Whether a requirement of that type can be on the wire.
[[nodiscard]] constexpr bool isWireType(std::uint32_t type) noexcept {
    return type >= 1 && type <= kKSTRequirementTypeMax;
}

[[nodiscard]] constexpr std::size_t compositeSize(const CompositeLayout& layout,
                                                  std::uint32_t childCount) noexcept {
    return layout.childrenOffset + childCount * kChildSize;
}

[[nodiscard]] inline std::size_t nodeSize(const KSTRequirement* node) noexcept {
    return sizeof(KSTRequirement) + node->dataLength;
}

/// The count as it is stored; 0 when the node is too short to have one.
[[nodiscard]] inline std::uint32_t storedChildCount(const KSTRequirement* node,
                                                    const CompositeLayout& layout) noexcept {
    std::uint32_t count = 0;
    if (nodeSize(node) >= layout.childrenOffset) {
        std::memcpy(&count, reinterpret_cast<const std::uint8_t*>(node) + layout.countOffset,
                    sizeof count);
    }
    return count;
}

/// How many children a node of that layout has: what it says, as far as it has slots for them.
[[nodiscard]] inline std::uint32_t childCount(const KSTRequirement* node,
                                              const CompositeLayout& layout) noexcept {
    if (nodeSize(node) < layout.childrenOffset) {
        return 0;
    }
    const std::size_t slots = (nodeSize(node) - layout.childrenOffset) / kChildSize;
    return std::min(storedChildCount(node, layout), static_cast<std::uint32_t>(slots));
}

/// The same for any node; a leaf has none.
[[nodiscard]] inline std::uint32_t childCount(const KSTRequirement* node) noexcept {
    const CompositeLayout* layout = findCompositeLayout(node->type);
    return layout != nullptr ? childCount(node, *layout) : 0;
}

/// Where the pointers to the children of `node`, a composite, begin.
[[nodiscard]] inline const std::uint8_t* childSlots(const KSTRequirement* node) noexcept {
    return reinterpret_cast<const std::uint8_t*>(node) +
           findCompositeLayout(node->type)->childrenOffset;
}

[[nodiscard]] inline KSTRequirement* childIn(const std::uint8_t* slot) noexcept {
    KSTRequirement* child = nullptr;
    std::memcpy(&child, slot, kChildSize);
    return child;
}

/// `index` is below `childCount`.
[[nodiscard]] inline KSTRequirement* childAt(const KSTRequirement* node,
                                             std::uint32_t index) noexcept {
    return childIn(childSlots(node) + index * kChildSize);
}

inline void setChildAt(KSTRequirement* node, std::uint32_t index,
                       const KSTRequirement* child) noexcept {
    const CompositeLayout& layout = *findCompositeLayout(node->type);
    std::memcpy(reinterpret_cast<std::uint8_t*>(node) + compositeSize(layout, index), &child,
                kChildSize);
}

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

} // namespace wire
