#include "KSTLib/RequirementSerialization.h"
#include "base/ByteReader.h"
#include "base/NotCopied.h"
#include "common/Allocation.h"
#include "common/Failure.h"
#include "common/LevelStack.h"
#include "wire/RequirementLayout.h"

#include <limits>
#include <span>
#include <utility>

namespace {

using Bytes = std::span<const std::uint8_t>;

constexpr const char* kFitsCheck = "size >= reqSize";

/// What a requirement on the wire says about itself.
struct Announcement {
    /// In memory.
    std::size_t nodeSize = 0;
    /// On the wire, without the children.
    std::size_t wireSize = 0;
    std::uint32_t childCount = 0;
};

KSTStatus readCompositeSizes(Bytes bytes, const wire::CompositeLayout& layout,
                             Announcement& announcement) {
    const kst::AssertionContext context = kst::serializationContext();
    base::ByteReader reader(bytes);
    std::uint32_t count = 0;
    if (!reader.skip(layout.countOffset) || !reader.readU32(count) ||
        wire::compositeSize(layout, count) > bytes.size()) {
        return kst::fail(context, kFitsCheck, 0, kKSTErrorBadParameter);
    }
    announcement = {wire::compositeSize(layout, count), layout.childrenOffset, count};
    if (announcement.nodeSize - sizeof(KSTRequirement) >
        std::numeric_limits<std::uint32_t>::max()) {
        return kst::fail(context, "reqSize - sizeof(KSTRequirement) <= UINT32_MAX", 0,
                         kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

/// Reads and checks the requirement at the start of `bytes`.
KSTStatus readAnnouncement(Bytes bytes, Announcement& announcement) {
    const kst::AssertionContext context = kst::serializationContext();
    KSTRequirement header{};
    base::ByteReader reader(bytes);
    if (!reader.readBytes(&header, sizeof header)) {
        return kst::fail(context, "size >= sizeof(KSTRequirement)", 0, kKSTErrorBadParameter);
    }
    if (!wire::isWireType(header.type)) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    if (const wire::CompositeLayout* layout = wire::findCompositeLayout(header.type)) {
        return readCompositeSizes(bytes, *layout, announcement);
    }
    const std::size_t size = wire::nodeSize(&header);
    if (size > bytes.size()) {
        return kst::fail(context, kFitsCheck, 0, kKSTErrorBadParameter);
    }
    announcement = {size, size, 0};
    return kKSTErrorSuccess;
}

/// A composite and its children that have been read already. Without a node when it is read only to
/// find the failure.
struct Level {
    KSTRequirement* node;
    std::uint32_t childCount;
    std::uint32_t next;
};

/// Builds the tree at the start of a buffer. What has been built belongs to the builder until it is
/// taken.
class TreeBuilder : private base::NotCopied {
  public:
    explicit TreeBuilder(Bytes bytes) : rest_(bytes) {}
    ~TreeBuilder() { DeallocRequirement(root_); }

    [[nodiscard]] KSTStatus build() {
        do {
            const KSTStatus err = readNode();
            if (err != kKSTErrorSuccess) {
                return kst::failLevels(kst::serializationContext(), err, levels_.size());
            }
        } while (nextSlot());
        return kKSTErrorSuccess;
    }

    [[nodiscard]] KSTRequirement* take() { return std::exchange(root_, nullptr); }

    /// What has not been read.
    [[nodiscard]] Bytes rest() const { return rest_; }

  private:
    /// Reads one requirement into the slot that `nextSlot` has gone to.
    KSTStatus readNode() {
        const kst::AssertionContext context = kst::serializationContext();
        Announcement announcement;
        const KSTStatus err = readAnnouncement(rest_, announcement);
        if (err != kKSTErrorSuccess) {
            return err;
        }
        canSucceed_ = canSucceed_ && hasBytesForAll(announcement);
        KSTRequirement* node = nullptr;
        if (canSucceed_) {
            node = makeNode(announcement);
            if (node == nullptr) {
                return kst::fail(context, "req", 0, kKSTErrorOutOfMemory);
            }
        }
        rest_ = rest_.subspan(announcement.wireSize);
        if (announcement.childCount == 0) {
            return kKSTErrorSuccess;
        }
        if (!levels_.push({node, announcement.childCount, 0})) {
            return kst::fail(context, "levels", 0, kKSTErrorOutOfMemory);
        }
        missing_ += announcement.childCount;
        return kKSTErrorSuccess;
    }

    /// Whether the buffer can hold all requirements that are still missing. When it cannot, the
    /// tree is only read to its failure and no longer built: counts that nothing stands behind must
    /// not cost memory, not even when every level has one.
    [[nodiscard]] bool hasBytesForAll(const Announcement& announcement) const {
        const std::size_t left = rest_.size() - announcement.wireSize;
        return missing_ + announcement.childCount <= left / sizeof(KSTRequirement);
    }

    /// A node with all but its children, in its slot. Null when there is no memory.
    KSTRequirement* makeNode(const Announcement& announcement) {
        void* const memory = kst::allocateUncleared(announcement.nodeSize);
        if (memory == nullptr) {
            return nullptr;
        }
        std::memcpy(memory, rest_.data(), announcement.wireSize);
        // The slots of the children, which are filled one by one.
        std::memset(static_cast<std::uint8_t*>(memory) + announcement.wireSize, 0,
                    announcement.nodeSize - announcement.wireSize);
        auto* const node = static_cast<KSTRequirement*>(memory);
        node->dataLength =
            static_cast<std::uint32_t>(announcement.nodeSize - sizeof(KSTRequirement));
        if (levels_.empty()) {
            root_ = node;
        } else {
            wire::setChildAt(levels_.top().node, levels_.top().next - 1, node);
        }
        return node;
    }

    /// Goes to the next slot without a child, out of the levels that are full. False when the tree
    /// is complete.
    bool nextSlot() {
        while (!levels_.empty()) {
            Level& level = levels_.top();
            if (level.next < level.childCount) {
                ++level.next;
                --missing_;
                return true;
            }
            levels_.pop();
        }
        return false;
    }

    Bytes rest_;
    kst::LevelStack<Level> levels_;
    KSTRequirement* root_ = nullptr;
    /// Children of the open levels that have not been begun.
    std::uint64_t missing_ = 0;
    bool canSucceed_ = true;
};

} // namespace

KSTStatus DeserializeRequirement(const void* buffer, std::size_t size,
                                 KSTRequirement** outRequirement,
                                 std::size_t* consumedBytes) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    if (buffer == nullptr) {
        return kst::fail(context, "buffer", 0, kKSTErrorBadParameter);
    }
    if (size < sizeof(KSTRequirement)) {
        return kst::fail(context, "size >= sizeof(KSTRequirement)", 0, kKSTErrorBadParameter);
    }
    KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(outRequirement, "requirement"),
                                           kst::Argument(consumedBytes, "consumedBytes"),
                                       });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    TreeBuilder builder({static_cast<const std::uint8_t*>(buffer), size});
    err = builder.build();
    if (err == kKSTErrorSuccess) {
        *consumedBytes = size - builder.rest().size();
        *outRequirement = builder.take();
    }
    return err;
}

namespace {

/// A node that is being freed counts in `state` the children it has been left to. Null when there
/// is no other child; otherwise the child's slot holds `parent` afterwards.
KSTRequirement* leaveForChild(KSTRequirement* node, KSTRequirement* parent) {
    const wire::CompositeLayout* const layout = wire::findCompositeLayout(node->type);
    if (layout == nullptr) {
        return nullptr;
    }
    const std::uint32_t count = wire::childCount(node, *layout);
    std::uint8_t* const slots = reinterpret_cast<std::uint8_t*>(node) + layout->childrenOffset;
    while (node->state < count) {
        std::uint8_t* const slot = slots + node->state++ * wire::kChildSize;
        if (KSTRequirement* child = wire::childIn(slot)) {
            std::memcpy(slot, &parent, wire::kChildSize);
            return child;
        }
    }
    return nullptr;
}

} // namespace

/// The way back up is kept in the nodes themselves, so that freeing needs no memory, however deep
/// the tree is: while a child is freed, its slot holds the parent of the node that it is a child
/// of.
void DeallocRequirement(KSTRequirement* requirement) noexcept {
    KSTRequirement* parent = nullptr;
    KSTRequirement* node = requirement;
    if (node != nullptr) {
        node->state = 0;
    }
    while (node != nullptr) {
        if (KSTRequirement* child = leaveForChild(node, parent)) {
            parent = node;
            node = child;
            node->state = 0;
        } else {
            kst::release(node, wire::nodeSize(node));
            node = parent;
            parent = node != nullptr ? wire::childAt(node, node->state - 1) : nullptr;
        }
    }
}
