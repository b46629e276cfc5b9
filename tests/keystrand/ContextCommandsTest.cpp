#include "tests/keystrand/KernelFixture.h"

namespace keystrand::test {

namespace {

using ContextCommandsTest = KernelFixture;

TEST_F(ContextCommandsTest, CreateRepliesWithTheHandleAndTheLogLevel) {
    kernel_.logLevel = 17;
    const CommandResult made = result(1, {}, 17);
    EXPECT_EQ(made.status, 0);
    EXPECT_EQ(made.output, Bytes().bytes(handle(1)).u8(17).get());
    EXPECT_EQ(result(1, {}).output, Bytes().bytes(handle(2)).u8(17).get());
    EXPECT_EQ(kernel_.contexts.all().size(), 2U);
}

TEST_F(ContextCommandsTest, NoContextIsMadeWhenItsHandleDoesNotFit) {
    EXPECT_EQ(result(1, {}, 16).status, -6008);
    EXPECT_EQ(result(1, {}, 0).status, -6008);
    EXPECT_TRUE(kernel_.contexts.all().empty());
}

TEST_F(ContextCommandsTest, OneContextTooMany) {
    for (std::size_t i = 0; i < ContextTable::kMaxCount; ++i) {
        createContext();
    }
    EXPECT_EQ(run(1, {}), -6011);
    EXPECT_EQ(run(2, handle(5)), 0);
    EXPECT_EQ(run(1, {}), 0);
}

TEST_F(ContextCommandsTest, DeleteEndsTheContextAndItsCredentials) {
    createContext();
    ASSERT_EQ(run(5, Bytes().bytes(handle(1)).bytes(passphrase("secret")).u32(1)), 0);
    EXPECT_EQ(run(2, handle(1)), 0);
    EXPECT_EQ(run(2, handle(1)), -6010);
    EXPECT_EQ(run(2, kNoHandle), -6010);
    EXPECT_EQ(run(19, handle(1)), -6010);
}

TEST_F(ContextCommandsTest, ExternalForm) {
    createContext();
    EXPECT_EQ(run(19, handle(1)), 0);
    EXPECT_EQ(run(19, handle(2)), -6010);
    EXPECT_EQ(result(18, handle(1), 5).output, (ByteVector{1, 0, 0, 0, 40}));
    EXPECT_EQ(result(18, handle(2), 5).output, (ByteVector{0, 0, 0, 0, 40}));
    EXPECT_EQ(result(18, handle(2)).status, 0);
    EXPECT_EQ(result(18, handle(1), 4).status, -6008);
}

TEST_F(ContextCommandsTest, PropertiesBelongToTheirContext) {
    createContext();
    createContext();
    EXPECT_EQ(run(22, Bytes().bytes(handle(1)).u32(7).text("value")), 0);
    EXPECT_EQ(result(21, Bytes().bytes(handle(1)).u32(7)).output, Bytes().text("value").get());
    EXPECT_EQ(result(21, Bytes().bytes(handle(2)).u32(7)).output, ByteVector());
    EXPECT_EQ(run(21, Bytes().bytes(handle(2)).u32(7)), 0);
    EXPECT_EQ(run(21, Bytes().bytes(handle(3)).u32(7)), -6010);
    EXPECT_EQ(run(22, Bytes().bytes(handle(3)).u32(7)), -6010);
    EXPECT_EQ(run(22, Bytes().bytes(handle(1)).u32(7)), 0);
    EXPECT_EQ(result(21, Bytes().bytes(handle(1)).u32(7)).output, ByteVector());
}

TEST_F(ContextCommandsTest, OnePropertyTooMany) {
    createContext();
    for (std::uint32_t id = 0; id < 64; ++id) {
        ASSERT_EQ(run(22, Bytes().bytes(handle(1)).u32(id).u8(1)), 0);
    }
    EXPECT_EQ(run(22, Bytes().bytes(handle(1)).u32(64).u8(1)), -6009);
}

} // namespace

} // namespace keystrand::test
