#include "keystrand/RequirementWire.h"

#include "KSTLib/RequirementSerialization.h"
#include "base/ByteWriter.h"
#include "common/Allocation.h"
#include "common/RequirementLayout.h"

#include <cassert>
#include <memory>
#include <new>
#include <span>

namespace keystrand {

namespace {

struct RequirementRelease {
    void operator()(KSTRequirement* node) const { DeallocRequirement(node); }
};
using NodePointer = std::unique_ptr<KSTRequirement, RequirementRelease>;

std::uint32_t typeOf(const Requirement& requirement) {
    switch (requirement.kind) {
    case Requirement::Kind::allOf:
        return kKSTRequirementTypeAnd;
    case Requirement::Kind::anyOf:
        return kKSTRequirementTypeOr;
    case Requirement::Kind::someOf:
        return kKSTRequirementTypeKofN;
    case Requirement::Kind::leaf:
        break;
    }
    return requirement.type->requirement;
}

/// A node whose data are zeros.
NodePointer makeNode(const Missing& missing, std::size_t dataLength) {
    void* memory = kst::allocate(sizeof(KSTRequirement) + dataLength);
    if (memory == nullptr) {
        throw std::bad_alloc();
    }
    return NodePointer(new (memory) KSTRequirement{
        .type = typeOf(*missing.requirement),
        .state = static_cast<std::uint32_t>(missing.state),
        .priority = missing.requirement->priority,
        .dataLength = static_cast<std::uint32_t>(dataLength),
    });
}

base::ByteWriter dataOf(const NodePointer& node) {
    return {reinterpret_cast<std::uint8_t*>(node.get() + 1), node->dataLength};
}

/// The first number of a leaf's data.
std::uint32_t leafNumber(const Requirement& leaf) {
    return leaf.type->requirement == kKSTRequirementTypePassphraseEntered
               ? leaf.purpose.value_or(0)
               : leaf.maxAge.value_or(kNoAgeLimit);
}

bool beginsWithNumber(const Requirement& leaf) {
    return leaf.type->requirement <= kKSTRequirementTypeBiometryMatched;
}

NodePointer buildLeaf(const Missing& missing) {
    const Requirement& leaf = *missing.requirement;
    NodePointer node = makeNode(missing, leaf.type->dataSize);
    if (beginsWithNumber(leaf)) {
        [[maybe_unused]] const bool fits = dataOf(node).writeU32(leafNumber(leaf));
        assert(fits);
    }
    return node;
}

NodePointer build(const Missing& missing) {
    if (missing.requirement->kind == Requirement::Kind::leaf) {
        return buildLeaf(missing);
    }
    const auto count = static_cast<std::uint32_t>(missing.children.size());
    const auto& layout = *kst::findCompositeLayout(typeOf(*missing.requirement));
    NodePointer node =
        makeNode(missing, kst::compositeSize(layout, count) - sizeof(KSTRequirement));
    base::ByteWriter writer = dataOf(node);
    [[maybe_unused]] const bool fits =
        (node->type != kKSTRequirementTypeKofN || writer.writeU32(missing.needed)) &&
        writer.writeU32(count);
    assert(fits);
    for (std::uint32_t i = 0; i < count; ++i) {
        kst::setChildAt(node.get(), i, build(missing.children[i]).release());
    }
    return node;
}

} // namespace

std::vector<std::uint8_t> encodeMissing(const Missing& missing) {
    const NodePointer root = build(missing);
    std::size_t size = 0;
    [[maybe_unused]] KSTStatus status = GetSerializedRequirementSize(root.get(), &size);
    assert(status == kKSTErrorSuccess);
    std::vector<std::uint8_t> bytes(size);
    status = SerializeRequirement(root.get(), bytes.data(), &size);
    assert(status == kKSTErrorSuccess && size == bytes.size());
    return bytes;
}

} // namespace keystrand
