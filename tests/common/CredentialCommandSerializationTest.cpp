#include "KSTLib/CredentialSerialization.h"
#include "tests/common/CredentialSamples.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace {

using support::asCredential;
using support::Bytes;
using support::credentialBytes;
using support::ExactBuffer;
using support::Lines;
using support::ScriptedGate;

/// Handle 1 to 16, a marker of type 4 for user 501, scope 1.
const Bytes kMarkerPayload = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11,   12,   13, 14, 15, 16, 4, 0,
                              0, 0, 1, 0, 0, 0, 0, 0, 0, 0,  0xf5, 0x01, 0,  0,  0,  0,  0, 0,
                              0, 0, 0, 0, 0, 0, 0, 0, 0, 0,  0,    0,    1,  0,  0,  0};

struct Triple {
    decltype(&GetSerializedAddCredentialSize) announce;
    decltype(&SerializeAddCredential) write;
    decltype(&DeserializeAddCredential) read;
    /// Whether a failure is passed up once more.
    bool isWrapper;
};

const Triple kTriples[] = {
    {GetSerializedAddCredentialSize, SerializeAddCredential, DeserializeAddCredential, false},
    {GetSerializedRemoveCredentialSize, SerializeRemoveCredential, DeserializeRemoveCredential,
     true},
    {GetSerializedReplacePassphraseCredentialSize, SerializeReplacePassphraseCredential,
     DeserializeReplacePassphraseCredential, true},
};

/// Each triple in turn: they differ in one line of the log only.
class CredentialCommand : public support::SerializationFixture,
                          public testing::WithParamInterface<Triple> {
  protected:
    /// The lines of a failure, with the one that a wrapper adds.
    void expectFailure(Lines lines, KSTStatus status = -3) {
        if (GetParam().isWrapper) {
            lines.push_back(failedCall(status));
        }
        expectLogged(lines);
    }

    KSTStatus read(const Bytes& bytes) {
        const ExactBuffer buffer(bytes);
        const std::int64_t before = gAllocatedBytes;
        const KSTStatus err =
            GetParam().read(buffer.data(), buffer.size(), &readHandle, &credential, &scope);
        if (err != kKSTErrorSuccess) {
            EXPECT_EQ(gAllocatedBytes, before);
            EXPECT_EQ(credential, nullptr);
            EXPECT_EQ(scope, 4711U);
        }
        return err;
    }

    void TearDown() override {
        if (credential != nullptr) {
            DeallocCredential(credential);
        }
        SerializationFixture::TearDown();
    }

    /// A payload around these bytes.
    static Bytes payloadAround(const Bytes& credentialBytes) {
        Bytes bytes(kMarkerPayload.begin(), kMarkerPayload.begin() + 16);
        support::append(bytes, credentialBytes);
        support::append(bytes, {2, 0, 0, 0});
        return bytes;
    }

    const KSTHandle handle = {{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16}};
    KSTHandle readHandle{};
    KSTCredential* credential = nullptr;
    KSTScope scope = 4711;
};

INSTANTIATE_TEST_SUITE_P(Triples, CredentialCommand, testing::ValuesIn(kTriples));

constexpr const char* kScopeCheck = "handle || scope == kKSTScopeGlobal";

} // namespace

TEST_P(CredentialCommand, ExactBytes) {
    const KSTCredential marker = {4, 1, 0, 501, 0, 0, 0};
    std::size_t size = 0;
    ASSERT_EQ(GetParam().announce(&handle, &marker, 1, &size), 0);
    EXPECT_EQ(size, 52U);
    const ExactBuffer buffer(size);
    ASSERT_EQ(GetParam().write(&handle, &marker, 1, buffer.data(), &size), 0);
    EXPECT_EQ(size, 52U);
    EXPECT_EQ(buffer.bytes(), kMarkerPayload);
    expectLogged({});
}

TEST_P(CredentialCommand, ThereAndBackAgain) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        SCOPED_TRACE(type);
        Bytes record = credentialBytes(type);
        std::size_t size = 0;
        ASSERT_EQ(GetParam().announce(&handle, asCredential(record), 2, &size), 0);
        EXPECT_EQ(size, record.size() + 20);
        const ExactBuffer buffer(size);
        ASSERT_EQ(GetParam().write(&handle, asCredential(record), 2, buffer.data(), &size), 0);
        EXPECT_EQ(buffer.bytes(), payloadAround(record));
        ASSERT_EQ(read(buffer.bytes()), 0);
        EXPECT_EQ(Bytes(readHandle.bytes, readHandle.bytes + 16),
                  Bytes(kMarkerPayload.begin(), kMarkerPayload.begin() + 16));
        EXPECT_EQ(scope, 2U);
        const ExactBuffer again(size);
        ASSERT_EQ(GetParam().write(&readHandle, credential, scope, again.data(), &size), 0);
        EXPECT_EQ(again.bytes(), buffer.bytes());
        DeallocCredential(credential);
        credential = nullptr;
    }
    expectLogged({});
}

TEST_P(CredentialCommand, GlobalScopeNeedsNoHandle) {
    Bytes record = credentialBytes(2);
    std::size_t size = 188;
    const ExactBuffer buffer(size);
    ASSERT_EQ(GetParam().write(nullptr, asCredential(record), 2, buffer.data(), &size), 0);
    Bytes golden = payloadAround(record);
    std::fill_n(golden.begin(), 16, std::uint8_t{0});
    EXPECT_EQ(buffer.bytes(), golden);
    EXPECT_EQ(golden[184], 2);
    expectLogged({});
}

TEST_P(CredentialCommand, OtherScopesNeedAHandle) {
    std::size_t size = 0;
    for (const KSTScope other : {0U, 1U, 3U, 0xffffffffU}) {
        EXPECT_EQ(GetParam().announce(nullptr, nullptr, other, nullptr), -3);
        expectFailure({failedCheck(kScopeCheck)});
        EXPECT_EQ(GetParam().write(nullptr, nullptr, other, nullptr, &size), -3);
        expectFailure({failedCheck(kScopeCheck)});
    }
}

TEST_P(CredentialCommand, MissingArguments) {
    Bytes record = credentialBytes(4);
    std::uint8_t buffer[100];
    EXPECT_EQ(GetParam().announce(&handle, nullptr, 1, nullptr), -3);
    expectFailure({failedCheck("credential")});
    EXPECT_EQ(GetParam().announce(&handle, asCredential(record), 1, nullptr), -3);
    expectFailure({failedCheck("outSize")});
    EXPECT_EQ(GetParam().write(&handle, nullptr, 1, nullptr, nullptr), -3);
    expectFailure({failedCheck("credential")});
    EXPECT_EQ(GetParam().write(&handle, asCredential(record), 1, nullptr, nullptr), -3);
    expectFailure({failedCheck("outBuffer")});
    EXPECT_EQ(GetParam().write(&handle, asCredential(record), 1, buffer, nullptr), -3);
    expectFailure({failedCheck("outSize")});
    EXPECT_EQ(GetParam().read(nullptr, 51, nullptr, nullptr, nullptr), -3);
    expectFailure({failedCheck("buffer")});
    const auto readInto = [&](KSTHandle* h, KSTCredential** c, KSTScope* s) {
        return GetParam().read(kMarkerPayload.data(), 52, h, c, s);
    };
    EXPECT_EQ(readInto(nullptr, nullptr, nullptr), -3);
    expectFailure({failedCheck("handle")});
    EXPECT_EQ(readInto(&readHandle, nullptr, nullptr), -3);
    expectFailure({failedCheck("credential")});
    EXPECT_EQ(readInto(&readHandle, &credential, nullptr), -3);
    expectFailure({failedCheck("scope")});
    EXPECT_EQ(readHandle.bytes[0], 0);
}

TEST_P(CredentialCommand, RoomAtItsLimit) {
    Bytes record = credentialBytes(12);
    for (const std::size_t capacity : {0U, 15U, 16U, 55U, 59U}) {
        const ExactBuffer buffer(capacity);
        std::size_t size = capacity;
        EXPECT_EQ(GetParam().write(&handle, asCredential(record), 1, buffer.data(), &size), -3);
        EXPECT_EQ(size, capacity);
        EXPECT_EQ(buffer.bytes(), Bytes(capacity, 0xa5));
        expectFailure({failedCheck("*outSize >= requiredSize")});
    }
    const ExactBuffer buffer(61);
    std::size_t size = 61;
    EXPECT_EQ(GetParam().write(&handle, asCredential(record), 1, buffer.data(), &size), 0);
    EXPECT_EQ(size, 60U);
    EXPECT_EQ(buffer.bytes().back(), 0xa5);
}

TEST_P(CredentialCommand, TypesOutside) {
    for (const std::uint32_t type : support::kTypesOutside) {
        Bytes record = credentialBytes(type, 0);
        std::size_t size = 52;
        const ExactBuffer buffer(size);
        EXPECT_EQ(GetParam().announce(&handle, asCredential(record), 1, &size), -3);
        expectFailure({failedCheck("0"), failedCall()});
        EXPECT_EQ(GetParam().write(&handle, asCredential(record), 1, buffer.data(), &size), -3);
        expectFailure({failedCheck("0"), failedCall(), failedCall()});
        EXPECT_EQ(buffer.bytes(), Bytes(52, 0xa5));
        EXPECT_EQ(read(payloadAround(record)), -3);
        EXPECT_EQ(readHandle.bytes[15], 16);
        expectFailure({failedCheck("0"), failedCall()});
    }
}

TEST_P(CredentialCommand, EveryTruncation) {
    const Bytes whole = payloadAround(credentialBytes(12));
    for (std::size_t length = 0; length < whole.size(); ++length) {
        SCOPED_TRACE(length);
        readHandle = {};
        EXPECT_EQ(read({whole.begin(), whole.begin() + static_cast<long>(length)}), -3);
        EXPECT_EQ(readHandle.bytes[15], length < 52 ? 0 : 16);
        if (length < 52) {
            expectFailure({failedCheck(
                "size >= sizeof(KSTHandle) + sizeof(KSTCredential) + sizeof(KSTScope)")});
        } else if (length < 56) {
            expectFailure({failedCheck("size >= credSize"), failedCall()});
        } else {
            expectFailure({failedCheck("size - offset >= sizeof(KSTScope)")});
        }
    }
}

TEST_P(CredentialCommand, LengthsThatAreNotTheTypes) {
    for (const std::uint32_t length : {0U, 7U, 9U, 0x80000000U, 0xffffffffU}) {
        Bytes bytes = payloadAround(credentialBytes(12));
        support::putU32(bytes, 16 + 28, length);
        EXPECT_EQ(read(bytes), -3);
        expectFailure(
            {failedCheck("dataLength == sizeof(KSTCredentialDataKextDenyList)"), failedCall()});
    }
}

TEST_P(CredentialCommand, TrailingBytesAndAnyScopeAreRead) {
    Bytes bytes(16);
    support::append(bytes, credentialBytes(4));
    support::append(bytes, {0xff, 0xff, 0xff, 0xff, 1, 2, 3});
    ASSERT_EQ(read(bytes), 0);
    EXPECT_EQ(scope, 0xffffffffU);
    EXPECT_EQ(credential->type, 4U);
    expectLogged({});
}

TEST_P(CredentialCommand, FailedAllocation) {
    const ScriptedGate gate(0);
    EXPECT_EQ(read(kMarkerPayload), -4);
    EXPECT_EQ(gate.asked, std::vector<std::size_t>{32});
    expectFailure({failedCheck("cred"), failedCall(-4)}, -4);
}

TEST_P(CredentialCommand, WhatWasBuiltIsWiped) {
    Bytes bytes = payloadAround(credentialBytes(2));
    bytes.resize(bytes.size() - 2);
    const ScriptedGate gate;
    EXPECT_EQ(read(bytes), -3);
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{168});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}
