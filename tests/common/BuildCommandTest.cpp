#include "KSTLib/LibCall.h"
#include "common/Allocation.h"
#include "tests/support/LibraryFixture.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

using support::ScriptedGate;

constexpr std::size_t kUntouchedSize = 4711;

class BuildCommand : public support::LibraryFixture {
  protected:
    /// The frame's bytes; the frame itself is given back.
    static std::vector<std::uint8_t> bytesOf(std::uint8_t* frame, std::size_t size) {
        std::vector<std::uint8_t> bytes(frame, frame + size);
        kst::release(frame, size);
        return bytes;
    }

    void expectNothingHappened(const std::uint8_t* frame) const {
        EXPECT_EQ(frame, nullptr);
        EXPECT_EQ(size, kUntouchedSize);
        EXPECT_TRUE(logged().empty());
        EXPECT_EQ(printed(), "");
    }

    std::size_t size = kUntouchedSize;
};

} // namespace

TEST_F(BuildCommand, ExactBytes) {
    const std::vector<std::uint8_t> payload{9, 8, 7};
    std::uint8_t* frame = LibCall_BuildCommand(26, 1, 2, payload.data(), payload.size(), &size);
    ASSERT_NE(frame, nullptr);
    EXPECT_EQ(size, 11U);
    EXPECT_EQ(bytesOf(frame, size),
              (std::vector<std::uint8_t>{'D', 'R', 'C', 'S', 26, 1, 2, 0, 9, 8, 7}));
    EXPECT_TRUE(logged().empty());
    EXPECT_EQ(printed(), "");
}

TEST_F(BuildCommand, CountsTheFrame) {
    const std::int64_t before = gAllocatedBytes;
    const std::vector<std::uint8_t> payload(100);
    std::uint8_t* frame = LibCall_BuildCommand(1, 0, 0, payload.data(), payload.size(), &size);
    EXPECT_EQ(gAllocatedBytes, before + 108);
    kst::release(frame, size);
}

TEST_F(BuildCommand, WithoutPayload) {
    const std::uint8_t byte = 0xff;
    for (const void* payload :
         {static_cast<const void*>(nullptr), static_cast<const void*>(&byte)}) {
        std::uint8_t* frame = LibCall_BuildCommand(1, 255, 0, payload, 0, &size);
        ASSERT_NE(frame, nullptr);
        EXPECT_EQ(size, 8U);
        EXPECT_EQ(bytesOf(frame, size),
                  (std::vector<std::uint8_t>{'D', 'R', 'C', 'S', 1, 255, 0, 0}));
    }
}

TEST_F(BuildCommand, PayloadOfOneByte) {
    const std::uint8_t byte = 0xa7;
    std::uint8_t* frame = LibCall_BuildCommand(26, 0, 0, &byte, 1, &size);
    ASSERT_NE(frame, nullptr);
    EXPECT_EQ(bytesOf(frame, size),
              (std::vector<std::uint8_t>{'D', 'R', 'C', 'S', 26, 0, 0, 0, 0xa7}));
}

TEST_F(BuildCommand, NullPayloadWithASize) {
    expectNothingHappened(LibCall_BuildCommand(1, 0, 0, nullptr, 1, &size));
}

TEST_F(BuildCommand, NoPlaceForTheSize) {
    EXPECT_EQ(LibCall_BuildCommand(1, 0, 0, nullptr, 0, nullptr), nullptr);
}

TEST_F(BuildCommand, FailedAllocation) {
    const ScriptedGate gate(0);
    const std::uint8_t byte = 0;
    expectNothingHappened(LibCall_BuildCommand(1, 0, 0, &byte, 1, &size));
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{9});
    EXPECT_TRUE(gate.freed.empty());
}

TEST_F(BuildCommand, SizesThatWrapOrThatNoMemoryHas) {
    const ScriptedGate gate;
    const std::uint8_t byte = 0;
    for (const std::size_t payloadSize :
         {SIZE_MAX, SIZE_MAX - 1, SIZE_MAX - 7, SIZE_MAX - 8, SIZE_MAX / 2 + 1}) {
        expectNothingHappened(LibCall_BuildCommand(1, 0, 0, &byte, payloadSize, &size));
    }
    EXPECT_TRUE(gate.asked.empty());
}
