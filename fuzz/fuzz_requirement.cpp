// Trees of requirements from outside: what can be read can be walked, comes back the same after it
// was written, and nothing stays allocated.

#include "KSTLib/Requirement.h"
#include "KSTLib/RequirementSerialization.h"
#include "fuzz/Payloads.h"

namespace {

using fuzz::require;

/// The properties are inside the node.
void checkProperties(const KSTRequirement* node) {
    const auto* begin = reinterpret_cast<const std::uint8_t*>(node);
    const auto check = [&](std::uint32_t /*propertyId*/, const void* data, std::size_t length) {
        const auto offset =
            static_cast<std::size_t>(static_cast<const std::uint8_t*>(data) - begin);
        require(offset + length <= sizeof(KSTRequirement) + node->dataLength);
    };
    require(KSTRequirementGetProperties(node, check) == 0);
}

/// Every node once. Each takes at least its header on the wire.
void walk(const KSTRequirement* tree, std::size_t consumed) {
    std::size_t nodes = 0;
    std::vector<const KSTRequirement*> pending = {tree};
    while (!pending.empty()) {
        const KSTRequirement* node = pending.back();
        pending.pop_back();
        ++nodes;
        checkProperties(node);
        const auto enter = [&pending](const KSTRequirement* child) {
            pending.push_back(child);
        };
        KSTRequirementGetSubrequirements(node, enter);
    }
    require(nodes * sizeof(KSTRequirement) <= consumed);
}

std::vector<std::uint8_t> written(const KSTRequirement* tree, std::size_t consumed) {
    std::size_t size = 0;
    require(GetSerializedRequirementSize(tree, &size) == 0 && size == consumed);
    std::vector<std::uint8_t> bytes(size);
    require(SerializeRequirement(tree, bytes.data(), &size) == 0 && size == consumed);
    return bytes;
}

/// What was written is what a second reader writes.
void checkBytes(const KSTRequirement* tree, std::size_t consumed) {
    const std::vector<std::uint8_t> bytes = written(tree, consumed);
    KSTRequirement* again = nullptr;
    std::size_t consumedAgain = 0;
    require(DeserializeRequirement(bytes.data(), bytes.size(), &again, &consumedAgain) == 0);
    require(consumedAgain == consumed && written(again, consumed) == bytes);
    DeallocRequirement(again);
}

void check(std::span<const std::uint8_t> input) {
    KSTRequirement* tree = nullptr;
    std::size_t consumed = 0;
    if (DeserializeRequirement(input.data(), input.size(), &tree, &consumed) == 0) {
        require(consumed <= input.size());
        walk(tree, consumed);
        checkBytes(tree, consumed);
        DeallocRequirement(tree);
    } else {
        require(tree == nullptr && consumed == 0);
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    return fuzz::checkInput(data, size, check);
}
