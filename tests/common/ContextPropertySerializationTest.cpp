#include "KSTLib/CredentialSerialization.h"
#include "tests/common/SerializationFixture.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::ExactBuffer;

using ContextProperty = support::SerializationFixture;

const Bytes kPayload = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 4, 3, 2, 1};
const KSTHandle kHandle = {{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16}};

} // namespace

TEST_F(ContextProperty, ThereAndBackAgain) {
    std::size_t size = 0;
    ASSERT_EQ(GetSerializedGetContextPropertySize(nullptr, 0, &size), 0);
    EXPECT_EQ(size, 20U);
    const ExactBuffer buffer(22);
    size = 22;
    ASSERT_EQ(SerializeGetContextProperty(&kHandle, 0x01020304, buffer.data(), &size), 0);
    EXPECT_EQ(size, 20U);
    Bytes golden = kPayload;
    support::append(golden, {0xa5, 0xa5});
    EXPECT_EQ(buffer.bytes(), golden);
    for (const std::size_t length : {20U, 21U, 22U}) {
        KSTHandle handle{};
        KSTContextProperty property = 0;
        ASSERT_EQ(DeserializeGetContextProperty(buffer.data(), length, &handle, &property), 0);
        EXPECT_EQ(Bytes(handle.bytes, handle.bytes + 16),
                  Bytes(kPayload.begin(), kPayload.begin() + 16));
        EXPECT_EQ(property, 0x01020304U);
    }
    expectLogged({});
}

TEST_F(ContextProperty, EveryTruncation) {
    for (std::size_t length = 0; length < kPayload.size(); ++length) {
        const ExactBuffer buffer({kPayload.begin(), kPayload.begin() + static_cast<long>(length)});
        KSTHandle handle{};
        KSTContextProperty property = 4711;
        EXPECT_EQ(DeserializeGetContextProperty(buffer.data(), length, &handle, &property), -3);
        EXPECT_EQ(handle.bytes[15], length < 16 ? 0 : 16);
        EXPECT_EQ(property, 4711U);
        expectLogged({failedCheck(length < 16 ? "(size - offset) >= sizeof(KSTHandle)"
                                              : "(size - offset) >= sizeof(KSTContextProperty)")});
    }
}

TEST_F(ContextProperty, RoomAtItsLimit) {
    for (const std::size_t capacity : {0U, 16U, 19U}) {
        const ExactBuffer buffer(capacity);
        std::size_t size = capacity;
        EXPECT_EQ(SerializeGetContextProperty(&kHandle, 1, buffer.data(), &size), -3);
        EXPECT_EQ(size, capacity);
        EXPECT_EQ(buffer.bytes(), Bytes(capacity, 0xa5));
        expectLogged({failedCheck("*outSize >= requiredSize")});
    }
}

TEST_F(ContextProperty, MissingArguments) {
    std::uint8_t buffer[20];
    KSTHandle handle{};
    std::size_t size = 20;
    EXPECT_EQ(GetSerializedGetContextPropertySize(&kHandle, 1, nullptr), -3);
    expectLogged({failedCheck("outSize")});
    EXPECT_EQ(SerializeGetContextProperty(nullptr, 1, nullptr, nullptr), -3);
    EXPECT_EQ(SerializeGetContextProperty(&kHandle, 1, nullptr, &size), -3);
    EXPECT_EQ(SerializeGetContextProperty(&kHandle, 1, buffer, nullptr), -3);
    expectLogged({failedCheck("handle"), failedCheck("outBuffer"), failedCheck("outSize")});
    EXPECT_EQ(DeserializeGetContextProperty(nullptr, 0, nullptr, nullptr), -3);
    EXPECT_EQ(DeserializeGetContextProperty(kPayload.data(), 0, nullptr, nullptr), -3);
    EXPECT_EQ(DeserializeGetContextProperty(kPayload.data(), 0, &handle, nullptr), -3);
    expectLogged({failedCheck("buffer"), failedCheck("handle"), failedCheck("property")});
}
