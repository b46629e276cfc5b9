#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/RequirementSerialization.h"
#include "keystrand/Evaluation.h"
#include "keystrand/PolicyRequirement.h"
#include "tests/keystrand/Credentials.h"

#include <gtest/gtest.h>

namespace keystrand::test {

namespace {

class RequirementWireTest : public testing::Test {
  protected:
    void TearDown() override {
        own_ = CredentialSet();
        EXPECT_EQ(gAllocatedBytes, allocatedBefore_);
    }

    [[nodiscard]] ByteVector encode(const std::string& text) const {
        TextParser parser(text);
        const auto requirement = parseRequirement(parser);
        EXPECT_TRUE(requirement) << text;
        const CredentialSet none;
        const Situation situation{.own = own_, .global = none, .user = {}, .now = 1000};
        const auto missing = whatIsMissing(*requirement, situation);
        EXPECT_TRUE(missing) << text;
        return encodeMissing(*missing);
    }

    static Bytes header(std::uint32_t type, std::uint32_t dataLength, std::uint32_t state = 1,
                        std::uint32_t priority = 0) {
        return Bytes().u32(type).u32(state).u32(priority).u32(dataLength);
    }

  private:
    std::int64_t allocatedBefore_ = gAllocatedBytes;

  protected:
    CredentialSet own_;
};

TEST_F(RequirementWireTest, Leaves) {
    const std::vector<std::pair<std::string, ByteVector>> cases = {
        {"passcode", header(1, 4).u32(0xffffffff)},
        {"passcode(age=300, priority=7)", header(1, 4, 1, 7).u32(300)},
        {"passphrase", header(2, 4).u32(0)},
        {"passphrase(purpose=9, age=5)", header(2, 4).u32(9)},
        {"biometry(age=1)", header(3, 68).u32(1).fill(64, 0)},
        {"user-output", header(13, 32).fill(32, 0)},
        {"marker-4", header(14, 0)},
        {"never(user=3)", header(16, 0)},
    };
    for (const auto& [text, bytes] : cases) {
        EXPECT_EQ(encode(text), bytes) << text;
    }
}

TEST_F(RequirementWireTest, StateOfALeafThatIsTooOld) {
    ASSERT_TRUE(own_.add(read(plainCredential(4)), 100));
    EXPECT_EQ(encode("marker-4(age=899)"), ByteVector(header(14, 0, 2)));
}

TEST_F(RequirementWireTest, CompositesHoldWhatIsMissing) {
    ASSERT_TRUE(own_.add(read(plainCredential(4)), 1000));
    EXPECT_EQ(encode("all-of(marker-4, marker-5, never)"),
              ByteVector(header(4, 20).u32(2).bytes(header(15, 0)).bytes(header(16, 0))));
    EXPECT_EQ(encode("any-of(marker-5, never)"),
              ByteVector(header(5, 20).u32(2).bytes(header(15, 0)).bytes(header(16, 0))));
    EXPECT_EQ(encode("3-of(marker-4, marker-5, never, marker-6)"),
              ByteVector(header(7, 32)
                             .u32(2)
                             .u32(3)
                             .bytes(header(15, 0))
                             .bytes(header(16, 0))
                             .bytes(header(6, 0))));
    EXPECT_EQ(encode("all-of(all-of(never), marker-4)"),
              ByteVector(header(4, 12).u32(1).bytes(header(4, 12)).u32(1).bytes(header(16, 0))));
}

TEST_F(RequirementWireTest, TreeHasTheSizeThatWasReckonedAndIsReadBack) {
    const std::string text = "2-of(passcode, all-of(passphrase, biometry), any-of(user-output, "
                             "never), marker-11)";
    TextParser parser(text);
    const ByteVector bytes = encode(text);
    EXPECT_EQ(bytes.size(), wireSize(*parseRequirement(parser)));
    KSTRequirement* tree = nullptr;
    std::size_t consumed = 0;
    ASSERT_EQ(DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed), 0);
    EXPECT_EQ(consumed, bytes.size());
    DeallocRequirement(tree);
}

} // namespace

} // namespace keystrand::test
