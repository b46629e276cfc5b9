#include "KSTLib/RequirementSerialization.h"

#include "base/ByteWriter.h"
#include "common/Failure.h"
#include "common/LevelStack.h"
#include "wire/RequirementLayout.h"

namespace {

/// The children of a composite that have not been walked.
struct Level {
    const std::uint8_t* nextSlot;
    std::uint32_t left;
};

using Levels = kst::LevelStack<Level>;

/// The next requirement in the order of the wire, or none at the end of the tree. Leaves the levels
/// whose children are all walked.
bool nextNode(Levels& levels, const KSTRequirement*& node) {
    while (!levels.empty()) {
        Level& level = levels.top();
        if (level.left > 0) {
            --level.left;
            node = wire::childIn(level.nextSlot);
            level.nextSlot += wire::kChildSize;
            return true;
        }
        levels.pop();
    }
    return false;
}

/// Calls `visit` with each requirement of a tree in the order of the wire, until one fails. That
/// failure has its line already; the enclosing levels get theirs here. `levels` is empty before and
/// after.
template <typename Visit>
KSTStatus walk(const KSTRequirement* root, Levels& levels, Visit visit) {
    const kst::AssertionContext context = kst::serializationContext();
    const KSTRequirement* node = root;
    do {
        KSTStatus err = visit(node);
        const std::uint32_t count = err == kKSTErrorSuccess ? wire::childCount(node) : 0;
        if (count > 0 && !levels.push({wire::childSlots(node), count})) {
            err = kst::fail(context, "levels", 0, kKSTErrorOutOfMemory);
        }
        if (err != kKSTErrorSuccess) {
            return kst::failLevels(context, err, levels.size());
        }
    } while (nextNode(levels, node));
    return kKSTErrorSuccess;
}

/// Adds what `node` itself takes on the wire to `size`.
KSTStatus measureNode(const KSTRequirement* node, std::size_t& size) {
    const kst::AssertionContext context = kst::serializationContext();
    if (node == nullptr) {
        return kst::fail(context, "requirement", 0, kKSTErrorBadParameter);
    }
    if (!wire::isWireType(node->type)) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    const wire::CompositeLayout* layout = wire::findCompositeLayout(node->type);
    if (layout == nullptr) {
        size += wire::nodeSize(node);
        return kKSTErrorSuccess;
    }
    if (wire::nodeSize(node) <
        wire::compositeSize(*layout, wire::storedChildCount(node, *layout))) {
        return kst::fail(context, "requirement->dataLength + sizeof(KSTRequirement) >= reqSize", 0,
                         kKSTErrorBadParameter);
    }
    size += layout->childrenOffset;
    return kKSTErrorSuccess;
}

KSTStatus measure(const KSTRequirement* requirement, Levels& levels, std::size_t& size) {
    return walk(requirement, levels,
                [&size](const KSTRequirement* node) { return measureNode(node, size); });
}

/// Writes what stands on the wire for `node` itself. It is what stands in memory before the
/// pointers to the children.
KSTStatus writeNode(const KSTRequirement* node, base::ByteWriter& writer) {
    const wire::CompositeLayout* layout = wire::findCompositeLayout(node->type);
    const std::size_t size = layout != nullptr ? layout->childrenOffset : wire::nodeSize(node);
    if (!writer.writeBytes(node, size)) {
        return kst::fail(kst::serializationContext(), "reqLen <= *bufferSize", 0,
                         kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus GetSerializedRequirementSize(const KSTRequirement* requirement,
                                       std::size_t* outSize) noexcept {
    KSTStatus err = kst::requireArguments(kst::serializationContext(),
                                          {
                                              kst::Argument(requirement, "requirement"),
                                              kst::Argument(outSize, "outSize"),
                                          });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    Levels levels;
    std::size_t size = 0;
    err = measure(requirement, levels, size);
    if (err == kKSTErrorSuccess) {
        *outSize = size;
    }
    return err;
}

KSTStatus SerializeRequirement(const KSTRequirement* requirement, void* buffer,
                               std::size_t* bufferSize) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    KSTStatus err = kst::requireArguments(context, {
                                                       kst::Argument(requirement, "requirement"),
                                                       kst::Argument(buffer, "buffer"),
                                                       kst::Argument(bufferSize, "bufferSize"),
                                                   });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // The second walk needs no more memory than the first and so cannot fail halfway.
    Levels levels;
    std::size_t size = 0;
    err = measure(requirement, levels, size);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    if (size > *bufferSize) {
        return kst::fail(context, "reqLen <= *bufferSize", 0, kKSTErrorBadParameter);
    }
    base::ByteWriter writer(buffer, size);
    err = walk(requirement, levels,
               [&writer](const KSTRequirement* node) { return writeNode(node, writer); });
    if (err == kKSTErrorSuccess) {
        *bufferSize = writer.written();
    }
    return err;
}
