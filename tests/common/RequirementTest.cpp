#include "KSTLib/RequirementSerialization.h"
#include "common/Allocation.h"
#include "tests/common/RequirementSamples.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <sys/mman.h>

namespace {

using support::asRequirement;
using support::Bytes;
using support::compositeBytes;
using support::compositeInMemory;
using support::ExactBuffer;
using support::leafBytes;
using support::Lines;
using support::ScriptedGate;

constexpr std::uint32_t kTypesOutside[] = {0, 17, 1000, 0x80000000U, 0xffffffffU};

class Requirement : public support::SerializationFixture {
  protected:
    KSTStatus read(const Bytes& bytes) {
        const ExactBuffer buffer(bytes);
        return DeserializeRequirement(buffer.data(), buffer.size(), &tree, &consumed);
    }

    /// Reads exactly `bytes`, which must be refused with these conditions and then `levels` times
    /// the line of a failed call.
    void expectRefused(const Bytes& bytes, const std::string& condition, std::size_t levels = 0,
                       KSTStatus status = -3) {
        const std::int64_t before = gAllocatedBytes;
        EXPECT_EQ(read(bytes), status);
        EXPECT_EQ(gAllocatedBytes, before);
        EXPECT_EQ(tree, nullptr);
        EXPECT_EQ(consumed, 4711U);
        expectLogged(failure(condition, levels, status));
    }

    static Lines failure(const std::string& condition, std::size_t levels, KSTStatus status = -3) {
        Lines lines = {failedCheck(condition)};
        lines.insert(lines.end(), levels, failedCall(status));
        return lines;
    }

    /// Reads `bytes` with more behind them and writes them again.
    void expectThereAndBack(const Bytes& bytes, std::size_t allocated) {
        for (const std::size_t trailing : {0U, 1U, 64U}) {
            Bytes input = bytes;
            input.resize(bytes.size() + trailing, 0xee);
            const std::int64_t before = gAllocatedBytes;
            ASSERT_EQ(read(input), 0);
            EXPECT_EQ(consumed, bytes.size());
            EXPECT_EQ(gAllocatedBytes, before + static_cast<std::int64_t>(allocated));
            std::size_t size = 0;
            EXPECT_EQ(GetSerializedRequirementSize(tree, &size), 0);
            EXPECT_EQ(size, bytes.size());
            const ExactBuffer target(size);
            EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
            EXPECT_EQ(size, bytes.size());
            EXPECT_EQ(target.bytes(), bytes);
            DeallocRequirement(tree);
            tree = nullptr;
            EXPECT_EQ(gAllocatedBytes, before);
        }
        expectLogged({});
    }

    void TearDown() override {
        DeallocRequirement(tree);
        SerializationFixture::TearDown();
    }

    KSTRequirement* tree = nullptr;
    std::size_t consumed = 4711;
};

/// One of two, the second an And of a passphrase alone; 82 bytes by hand.
const Bytes kGolden = {
    7,    0,    0, 0, 1, 0, 0, 0, 2, 0, 0, 0, 24, 0, 0, 0, // header; 8 + 2 * 8
    1,    0,    0, 0, 2, 0, 0, 0,                          // K, count
    3,    0,    0, 0, 0, 0, 0, 0, 5, 0, 0, 0, 2,  0, 0, 0, // header of a leaf
    0xab, 0xcd,                                            // its data
    4,    0,    0, 0, 9, 0, 0, 0, 0, 0, 0, 0, 12, 0, 0, 0, // header; 4 + 1 * 8
    1,    0,    0, 0,                                      // count
    2,    0,    0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 4,  0, 0, 0, // header of a leaf
    1,    2,    3, 4,                                      // its data
};

KSTRequirement* childOf(const KSTRequirement* node, std::size_t offset) {
    KSTRequirement* child = nullptr;
    std::memcpy(&child, reinterpret_cast<const std::uint8_t*>(node) + offset, sizeof child);
    return child;
}

} // namespace

TEST_F(Requirement, TreeInMemory) {
    ASSERT_EQ(read(kGolden), 0);
    EXPECT_EQ(consumed, kGolden.size());
    EXPECT_EQ(tree->type, 7U);
    EXPECT_EQ(tree->state, 1U);
    EXPECT_EQ(tree->priority, 2U);
    EXPECT_EQ(tree->dataLength, 24U);
    const auto* data = reinterpret_cast<const KSTRequirementDataKofN*>(tree + 1);
    EXPECT_EQ(data->k, 1U);
    EXPECT_EQ(data->subrequirementsCount, 2U);

    const KSTRequirement* leaf = childOf(tree, 24);
    EXPECT_EQ(leaf->type, 3U);
    EXPECT_EQ(leaf->priority, 5U);
    EXPECT_EQ(leaf->dataLength, 2U);
    EXPECT_EQ(reinterpret_cast<const std::uint8_t*>(leaf)[17], 0xcd);

    const KSTRequirement* list = childOf(tree, 32);
    EXPECT_EQ(list->type, 4U);
    EXPECT_EQ(list->state, 9U);
    EXPECT_EQ(list->dataLength, 12U);
    // Not aligned, right behind the four bytes of the count.
    EXPECT_EQ(childOf(list, 20)->type, 2U);
}

TEST_F(Requirement, ThereAndBack) {
    expectThereAndBack(kGolden, 40 + 18 + 28 + 20);
    for (const std::uint32_t type : support::kLeafTypes) {
        for (const std::uint32_t length : {0U, 1U, 68U, 1000U}) {
            SCOPED_TRACE(type);
            expectThereAndBack(leafBytes(type, length), 16 + length);
        }
    }
    for (const std::uint32_t type : support::kCompositeTypes) {
        SCOPED_TRACE(type);
        const std::size_t prefix = type == 7 ? 24 : 20;
        expectThereAndBack(compositeBytes(type, {}), prefix);
        expectThereAndBack(compositeBytes(type, {leafBytes(16), leafBytes(1, 5)}),
                           prefix + 16 + 16 + 21);
        const Bytes inner = compositeBytes(type, {leafBytes(2, 1), compositeBytes(4, {})});
        expectThereAndBack(compositeBytes(type, {inner, leafBytes(3, 7), inner}),
                           prefix + 24 + 2 * (prefix + 16 + 17 + 20) + 23);
    }
}

TEST_F(Requirement, KnownSizes) {
    const struct {
        Bytes bytes;
        std::size_t size;
        std::uint8_t dataLength;
        std::size_t allocated;
    } kTrees[] = {
        {leafBytes(16), 16, 0, 16},
        {compositeBytes(4, {}), 20, 4, 20},
        {compositeBytes(7, {}), 24, 8, 24},
        {compositeBytes(4, {leafBytes(1), leafBytes(2)}), 52, 20, 36 + 2 * 16},
    };
    for (const auto& known : kTrees) {
        EXPECT_EQ(known.bytes.size(), known.size);
        EXPECT_EQ(known.bytes[12], known.dataLength);
        expectThereAndBack(known.bytes, known.allocated);
    }
}

TEST_F(Requirement, DataLengthOfACompositeIsWrittenAsItStands) {
    Bytes child = leafBytes(2, 4);
    for (const std::uint32_t type : support::kCompositeTypes) {
        // Room for three children, of which one is there.
        Bytes bytes =
            support::compositeInMemory(type, {support::asRequirement(child), nullptr, nullptr});
        support::putU32(bytes, type == 7 ? 20 : 16, 1);
        const std::size_t front = type == 7 ? 24 : 20;
        Bytes expected(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(front));
        support::append(expected, child);
        std::size_t size = expected.size();
        const ExactBuffer target(size);
        EXPECT_EQ(SerializeRequirement(support::asRequirement(bytes), target.data(), &size), 0);
        EXPECT_EQ(target.bytes(), expected);
        EXPECT_EQ(target.bytes()[12], type == 7 ? 8 + 3 * 8 : 4 + 3 * 8);
    }
    expectLogged({});
}

TEST_F(Requirement, DataLengthOfACompositeIsNotRead) {
    const Bytes right = compositeBytes(5, {leafBytes(1, 3)});
    for (const std::uint32_t length : {0U, 3U, 11U, 13U, 0x80000000U, 0xffffffffU}) {
        Bytes bytes = right;
        support::putU32(bytes, 12, length);
        ASSERT_EQ(read(bytes), 0);
        EXPECT_EQ(tree->dataLength, 12U);
        ExactBuffer target(right.size());
        std::size_t size = target.size();
        EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
        EXPECT_EQ(target.bytes(), right);
        DeallocRequirement(tree);
        tree = nullptr;
    }
}

TEST_F(Requirement, EveryTruncation) {
    // Where each level begins and ends, from the outside in.
    const auto levelsAt = [](std::size_t size) {
        return std::size_t{size >= 42 + 28 ? 2U : size >= 24 + 16 ? 1U : 0U};
    };
    for (std::size_t size = 0; size < kGolden.size(); ++size) {
        SCOPED_TRACE(size);
        const Bytes bytes(kGolden.begin(), kGolden.begin() + static_cast<std::ptrdiff_t>(size));
        std::size_t begin = 0;
        if (size >= 40) {
            begin = size < 42 ? 24 : 42;
        }
        if (begin == 42 && size >= 42 + 28) {
            begin = 62;
        }
        const std::string condition =
            size - begin < 16 ? "size >= sizeof(KSTRequirement)" : "size >= reqSize";
        expectRefused(bytes, condition, levelsAt(size));
    }
}

TEST_F(Requirement, LengthsOfALeaf) {
    for (const std::uint32_t length : {6U, 0x80000000U, 0xffffffffU}) {
        Bytes bytes = leafBytes(1, 5);
        support::putU32(bytes, 12, length);
        const ScriptedGate gate;
        expectRefused(bytes, "size >= reqSize");
        EXPECT_TRUE(gate.asked.empty());
    }
}

TEST_F(Requirement, CountsOfAComposite) {
    for (const std::uint32_t type : support::kCompositeTypes) {
        SCOPED_TRACE(type);
        const std::size_t prefix = type == 7 ? 24 : 20;
        const std::size_t room = 8 * 10;
        for (const std::uint32_t count : {11U, 0x20000000U, 0x80000000U, 0xffffffffU}) {
            Bytes bytes = compositeBytes(type, count, {});
            bytes.resize(prefix + room);
            const ScriptedGate gate;
            expectRefused(bytes, "size >= reqSize");
            EXPECT_TRUE(gate.asked.empty());
        }
        // As many as the plausibility bound admits; they are not there.
        Bytes bytes = compositeBytes(type, 10, {leafBytes(1), leafBytes(1)});
        bytes.resize(prefix + room);
        expectRefused(bytes, "0", 1);
        // Sixteen bytes and one child.
        bytes = compositeBytes(type, 1, {});
        for (std::size_t size = 16; size < prefix + 8; ++size) {
            Bytes cut = bytes;
            cut.resize(size);
            const ScriptedGate gate;
            expectRefused(cut, "size >= reqSize");
            EXPECT_TRUE(gate.asked.empty());
        }
        // Too short for its count, whatever that is.
        bytes = compositeBytes(type, 0, {});
        for (std::size_t size = 16; size < prefix; ++size) {
            expectRefused({bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(size)},
                          "size >= reqSize");
        }
    }
}

TEST_F(Requirement, CountWhoseNodeHasNoLength) {
    // A buffer of more than four gigabytes, of which only the first page is ever touched.
    const std::size_t size = 5ULL << 30U;
    void* buffer = ::mmap(nullptr, size, PROT_READ | PROT_WRITE,
                          MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    ASSERT_NE(buffer, MAP_FAILED);
    Bytes bytes = compositeBytes(4, 0x20000000U, {});
    std::memcpy(buffer, bytes.data(), bytes.size());
    const ScriptedGate gate;
    EXPECT_EQ(DeserializeRequirement(buffer, size, &tree, &consumed), -3);
    expectLogged({failedCheck("reqSize - sizeof(KSTRequirement) <= UINT32_MAX")});
    // With one child less it has one, and it is the first child that is none.
    bytes = compositeBytes(4, 0x1fffffffU, {});
    std::memcpy(buffer, bytes.data(), bytes.size());
    EXPECT_EQ(DeserializeRequirement(buffer, size, &tree, &consumed), -3);
    expectLogged({failedCheck("0"), failedCall(-3)});
    EXPECT_TRUE(gate.asked.empty());
    ::munmap(buffer, size);
}

TEST_F(Requirement, TypesOutside) {
    const ExactBuffer target(100);
    for (const std::uint32_t type : kTypesOutside) {
        SCOPED_TRACE(type);
        expectRefused(leafBytes(type), "0");
        expectRefused(compositeBytes(7, {leafBytes(1), compositeBytes(5, {leafBytes(type)})}), "0",
                      2);

        Bytes leaf = leafBytes(type);
        Bytes root = compositeInMemory(4, {asRequirement(leaf)});
        std::size_t size = 100;
        EXPECT_EQ(GetSerializedRequirementSize(asRequirement(leaf), &size), -3);
        expectLogged(failure("0", 0));
        EXPECT_EQ(GetSerializedRequirementSize(asRequirement(root), &size), -3);
        expectLogged(failure("0", 1));
        EXPECT_EQ(SerializeRequirement(asRequirement(leaf), target.data(), &size), -3);
        expectLogged(failure("0", 1));
        EXPECT_EQ(SerializeRequirement(asRequirement(root), target.data(), &size), -3);
        expectLogged(failure("0", 2));
        EXPECT_EQ(size, 100U);
    }
    EXPECT_EQ(target.bytes(), ExactBuffer(100).bytes());
}

TEST_F(Requirement, TreesThatCannotBeWritten) {
    Bytes first = leafBytes(1);
    std::size_t size = 100;
    Bytes withNull = compositeInMemory(7, {asRequirement(first), nullptr});
    EXPECT_EQ(GetSerializedRequirementSize(asRequirement(withNull), &size), -3);
    expectLogged(failure("requirement", 1));

    const char* check = "requirement->dataLength + sizeof(KSTRequirement) >= reqSize";
    for (const std::uint32_t type : support::kCompositeTypes) {
        Bytes root = compositeInMemory(type, {asRequirement(first)});
        const auto right = static_cast<std::uint32_t>(root.size() - 16);
        for (std::uint32_t length = 0; length < right; ++length) {
            Bytes cut(root.begin(), root.begin() + 16 + length);
            support::putU32(cut, 12, length);
            EXPECT_EQ(GetSerializedRequirementSize(asRequirement(cut), &size), -3);
            expectLogged(failure(check, 0));
        }
    }
    EXPECT_EQ(size, 100U);
}

TEST_F(Requirement, RoomForTheTree) {
    ASSERT_EQ(read(kGolden), 0);
    for (const std::size_t room :
         {std::size_t{0}, kGolden.size() - 1, kGolden.size(), kGolden.size() + 1}) {
        SCOPED_TRACE(room);
        const bool fits = room >= kGolden.size();
        const ExactBuffer target(room);
        std::size_t size = room;
        EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), fits ? 0 : -3);
        EXPECT_EQ(size, fits ? kGolden.size() : room);
        Bytes expected = ExactBuffer(room).bytes();
        if (fits) {
            std::copy(kGolden.begin(), kGolden.end(), expected.begin());
        }
        EXPECT_EQ(target.bytes(), expected);
        expectLogged(fits ? Lines() : failure("reqLen <= *bufferSize", 0));
    }
}

TEST_F(Requirement, SecondChildTruncated) {
    Bytes bytes = compositeBytes(4, {leafBytes(2, 8), leafBytes(1, 8)});
    bytes.pop_back();
    const ScriptedGate gate;
    expectRefused(bytes, "size >= reqSize", 1);
    EXPECT_EQ(gate.asked, (std::vector<std::size_t>{36, 24}));
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{24, 36}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(Requirement, FreedChildrenFirstAndWiped) {
    ASSERT_EQ(read(kGolden), 0);
    const ScriptedGate gate;
    DeallocRequirement(tree);
    tree = nullptr;
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{18, 20, 28, 40}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
    DeallocRequirement(nullptr);
    expectLogged({});
}

TEST_F(Requirement, InMemoryCompositeIsFreedWithItsChildren) {
    const auto make = [](const Bytes& bytes) {
        auto* node = static_cast<KSTRequirement*>(kst::allocate(bytes.size()));
        std::memcpy(node, bytes.data(), bytes.size());
        return node;
    };
    KSTRequirement* children[3] = {make(leafBytes(1, 3)), nullptr, nullptr};
    children[2] = make(compositeInMemory(4, {make(leafBytes(2, 5)), nullptr}));
    Bytes bytes = support::requirementHeader(1000, 17 + 4 + sizeof children);
    bytes.resize(16 + 17, 0x77);
    support::append(bytes, {3, 0, 0, 0});
    const auto* pointers = reinterpret_cast<const std::uint8_t*>(children);
    support::append(bytes, {pointers, pointers + sizeof children});

    const ScriptedGate gate;
    DeallocRequirement(make(bytes));
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{19, 21, 36, bytes.size()}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
    expectLogged({});
}

TEST_F(Requirement, EveryAllocationFailed) {
    const std::size_t enclosing[] = {0, 1, 1, 2};
    for (std::size_t refused = 0; refused < 4; ++refused) {
        SCOPED_TRACE(refused);
        const ScriptedGate gate(refused);
        expectRefused(kGolden, "req", enclosing[refused], -4);
        EXPECT_EQ(gate.asked.size(), refused + 1);
        EXPECT_EQ(gate.freed.size(), refused);
        EXPECT_TRUE(gate.everyFreeWasWiped);
    }
    ASSERT_EQ(read(kGolden), 0);
    // Trees of usual depth are measured and written without any.
    const ScriptedGate gate(0);
    ExactBuffer target(kGolden.size());
    std::size_t size = target.size();
    EXPECT_EQ(SerializeRequirement(tree, target.data(), &size), 0);
    EXPECT_TRUE(gate.asked.empty());
}

TEST_F(Requirement, NullArguments) {
    Bytes leaf = leafBytes(1);
    std::uint8_t target[64];
    std::size_t size = sizeof target;
    const std::pair<KSTStatus, const char*> results[] = {
        {GetSerializedRequirementSize(nullptr, &size), "requirement"},
        {GetSerializedRequirementSize(asRequirement(leaf), nullptr), "outSize"},
        {SerializeRequirement(nullptr, target, &size), "requirement"},
        {SerializeRequirement(asRequirement(leaf), nullptr, &size), "buffer"},
        {SerializeRequirement(asRequirement(leaf), target, nullptr), "bufferSize"},
        {DeserializeRequirement(nullptr, 16, &tree, &consumed), "buffer"},
        // The size is looked at before the outputs are.
        {DeserializeRequirement(leaf.data(), 15, nullptr, nullptr),
         "size >= sizeof(KSTRequirement)"},
        {DeserializeRequirement(leaf.data(), 16, nullptr, &consumed), "requirement"},
        {DeserializeRequirement(leaf.data(), 16, &tree, nullptr), "consumedBytes"},
    };
    Lines lines;
    for (const auto& [status, condition] : results) {
        EXPECT_EQ(status, -3) << condition;
        lines.push_back(failedCheck(condition));
    }
    expectLogged(lines);
    EXPECT_EQ(size, sizeof target);
    EXPECT_EQ(tree, nullptr);
}
