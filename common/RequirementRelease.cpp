#include "KSTLib/RequirementSerialization.h"
#include "common/Allocation.h"
#include "common/RequirementLayout.h"

namespace {

/// A node that is being freed counts in `state` the children it has been left to. Null when there
/// is no other child.
KSTRequirement* nextChild(KSTRequirement* node) {
    const std::uint32_t count = kst::childCount(node);
    while (node->state < count) {
        if (KSTRequirement* child = kst::childAt(node, node->state++)) {
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
        if (KSTRequirement* child = nextChild(node)) {
            kst::setChildAt(node, node->state - 1, parent);
            parent = node;
            node = child;
            node->state = 0;
        } else {
            kst::release(node, kst::nodeSize(node));
            node = parent;
            parent = node != nullptr ? kst::childAt(node, node->state - 1) : nullptr;
        }
    }
}
