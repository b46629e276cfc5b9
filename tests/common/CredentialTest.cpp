#include "KSTLib/CredentialSerialization.h"
#include "tests/common/CredentialSamples.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::credentialBytes;
using support::ExactBuffer;
using support::Lines;
using support::ScriptedGate;

const char* const kSizeChecks[] = {
    "dataLength == sizeof(KSTCredentialDataPasscodeValidated)",
    "dataLength == sizeof(KSTCredentialDataPassphraseEntered)",
    "dataLength == sizeof(KSTCredentialDataBiometryMatched)",
    "dataLength == 0",
    "dataLength == 0",
    "dataLength == 0",
    "dataLength == sizeof(KSTCredentialDataUserOutputDisplayed)",
    "dataLength == 0",
    "dataLength == sizeof(KSTCredentialDataContinuityUnlock)",
    "dataLength == sizeof(KSTCredentialDataPasscodeValidated2)",
    "dataLength == 0",
    "dataLength == sizeof(KSTCredentialDataKextDenyList)",
};

/// 0x11 bytes stand for a secret that has to be wiped.
const Bytes kDenyList = {
    12,   0,    0,    0,                         // type
    1,    0,    0,    0,                         // word at 4
    2,    0,    0,    0,                         // word at 8
    0xf5, 0x01, 0,    0,                         // user id
    8,    7,    6,    5,    4,    3,    2,    1, // word at 16
    9,    0,    0,    0,                         // word at 24
    8,    0,    0,    0,                         // dataLength
    0x11, 0x11, 0x11, 0x11, 0x11, 0x11, 0x11, 0x11,
};

class Credential : public support::SerializationFixture {
  protected:
    /// Reads exactly `bytes`, which must be refused with `line` alone.
    void expectRefused(const Bytes& bytes, const std::string& condition) {
        const ExactBuffer buffer(bytes);
        const std::int64_t before = gAllocatedBytes;
        EXPECT_EQ(DeserializeCredential(buffer.data(), buffer.size(), &credential, &consumed), -3);
        EXPECT_EQ(gAllocatedBytes, before);
        EXPECT_EQ(credential, nullptr);
        EXPECT_EQ(consumed, 4711U);
        expectLogged({failedCheck(condition)});
    }

    void read(const Bytes& bytes) {
        const ExactBuffer buffer(bytes);
        ASSERT_EQ(DeserializeCredential(buffer.data(), buffer.size(), &credential, &consumed), 0);
    }

    void TearDown() override {
        if (credential != nullptr) {
            DeallocCredential(credential);
        }
        SerializationFixture::TearDown();
    }

    KSTCredential* credential = nullptr;
    std::size_t consumed = 4711;
};

} // namespace

TEST_F(Credential, FieldsOfARecord) {
    read(kDenyList);
    EXPECT_EQ(consumed, 40U);
    EXPECT_EQ(credential->type, 12U);
    EXPECT_EQ(credential->word4, 1U);
    EXPECT_EQ(credential->word8, 2U);
    EXPECT_EQ(credential->userId, 501U);
    EXPECT_EQ(credential->word16, 0x0102030405060708U);
    EXPECT_EQ(credential->word24, 9U);
    EXPECT_EQ(credential->dataLength, 8U);
    const auto* data = reinterpret_cast<const KSTCredentialDataKextDenyList*>(credential + 1);
    EXPECT_EQ(data->format, 0x11111111U);
    EXPECT_EQ(data->revision, 0x11111111U);
}

TEST_F(Credential, EveryTypeThereAndBack) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        SCOPED_TRACE(type);
        const Bytes bytes = credentialBytes(type);
        for (const std::size_t trailing : {0U, 1U, 100U}) {
            Bytes input = bytes;
            input.resize(bytes.size() + trailing, 0xee);
            const std::int64_t before = gAllocatedBytes;
            read(input);
            EXPECT_EQ(consumed, bytes.size());
            EXPECT_EQ(gAllocatedBytes, before + static_cast<std::int64_t>(bytes.size()));

            std::size_t size = 0;
            EXPECT_EQ(GetSerializedCredentialSize(credential, &size), 0);
            EXPECT_EQ(size, bytes.size());
            const ExactBuffer target(size);
            EXPECT_EQ(SerializeCredential(credential, target.data(), &size), 0);
            EXPECT_EQ(size, bytes.size());
            EXPECT_EQ(target.bytes(), bytes);
            DeallocCredential(credential);
            credential = nullptr;
            EXPECT_EQ(gAllocatedBytes, before);
        }
    }
    expectLogged({});
}

TEST_F(Credential, EveryTruncation) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        const Bytes bytes = credentialBytes(type);
        for (std::size_t size = 0; size < bytes.size(); ++size) {
            SCOPED_TRACE(testing::Message() << "type " << type << ", size " << size);
            const ScriptedGate gate;
            expectRefused({bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(size)},
                          size < 32 ? "size >= sizeof(KSTCredential)" : "size >= credSize");
            // The room is there before the length is known to be.
            const std::vector<std::size_t> allocated =
                size < 32 ? std::vector<std::size_t>() : std::vector<std::size_t>{bytes.size()};
            EXPECT_EQ(gate.asked, allocated);
            EXPECT_EQ(gate.freed, allocated);
            EXPECT_TRUE(gate.everyFreeWasWiped);
        }
    }
}

TEST_F(Credential, LengthThatIsNotTheTypes) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        const std::uint32_t right = support::kCredentialDataSizes.at(type - 1);
        for (const std::uint32_t length : {0U, right - 1, right + 1, 0x80000000U, 0xffffffffU}) {
            if (length == right) {
                continue;
            }
            SCOPED_TRACE(testing::Message() << "type " << type << ", length " << length);
            Bytes bytes = credentialBytes(type);
            bytes.resize(bytes.size() + 4);
            support::putU32(bytes, 28, length);
            const ScriptedGate gate;
            expectRefused(bytes, kSizeChecks[type - 1]);
            EXPECT_TRUE(gate.asked.empty());
        }
    }
}

TEST_F(Credential, TypesOutside) {
    for (const std::uint32_t type : support::kTypesOutside) {
        SCOPED_TRACE(type);
        Bytes bytes = credentialBytes(type, 0);
        expectRefused(bytes, "0");

        std::size_t size = 100;
        EXPECT_EQ(GetSerializedCredentialSize(support::asCredential(bytes), &size), -3);
        EXPECT_EQ(size, 100U);
        expectLogged({failedCheck("0")});
        const ExactBuffer target(100);
        EXPECT_EQ(SerializeCredential(support::asCredential(bytes), target.data(), &size), -3);
        EXPECT_EQ(size, 100U);
        EXPECT_EQ(target.bytes(), ExactBuffer(100).bytes());
        expectLogged({failedCheck("0"), failedCall()});
    }
    expectRefused(Bytes(31), "size >= sizeof(KSTCredential)");
}

TEST_F(Credential, SizeIsWhatTheRecordSays) {
    Bytes bytes = credentialBytes(4, 0);
    for (const std::uint32_t length : {0U, 1U, 0x80000000U, 0xffffffffU}) {
        support::putU32(bytes, 28, length);
        std::size_t size = 0;
        EXPECT_EQ(GetSerializedCredentialSize(support::asCredential(bytes), &size), 0);
        EXPECT_EQ(size, std::size_t{32} + length);
    }
}

TEST_F(Credential, RoomForTheRecord) {
    Bytes bytes = credentialBytes(2);
    for (const std::size_t room :
         {std::size_t{0}, bytes.size() - 1, bytes.size(), bytes.size() + 1}) {
        SCOPED_TRACE(room);
        const ExactBuffer target(room);
        std::size_t size = room;
        const bool fits = room >= bytes.size();
        EXPECT_EQ(SerializeCredential(support::asCredential(bytes), target.data(), &size),
                  fits ? 0 : -3);
        EXPECT_EQ(size, fits ? bytes.size() : room);
        Bytes expected = ExactBuffer(room).bytes();
        if (fits) {
            std::copy(bytes.begin(), bytes.end(), expected.begin());
        }
        EXPECT_EQ(target.bytes(), expected);
        expectLogged(fits ? Lines() : Lines{failedCheck("credLen <= *outSize")});
    }
}

TEST_F(Credential, Copy) {
    // Neither the type nor its length is looked at.
    for (const auto& [type, length] :
         {std::pair{2U, 136U}, {4U, 0U}, {12U, 8U}, {0U, 3U}, {99U, 500U}}) {
        SCOPED_TRACE(type);
        Bytes bytes = credentialBytes(type, length);
        ASSERT_EQ(CopyCredential(support::asCredential(bytes), &credential), 0);
        const auto* copied = reinterpret_cast<const std::uint8_t*>(credential);
        EXPECT_EQ(Bytes(copied, copied + bytes.size()), bytes);
        DeallocCredential(credential);
        credential = nullptr;
    }
    expectLogged({});
}

TEST_F(Credential, WipedWhenFreed) {
    const ScriptedGate gate;
    read(kDenyList);
    DeallocCredential(credential);
    credential = nullptr;
    EXPECT_EQ(gate.freed, std::vector<std::size_t>{40});
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(Credential, FailedAllocation) {
    Bytes bytes = kDenyList;
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(DeserializeCredential(bytes.data(), bytes.size(), &credential, &consumed), -4);
        EXPECT_EQ(gate.asked, std::vector<std::size_t>{40});
        expectLogged({failedCheck("cred")});
    }
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(CopyCredential(support::asCredential(bytes), &credential), -4);
        expectLogged({failedCheck("cred")});
    }
    EXPECT_EQ(credential, nullptr);
    EXPECT_EQ(consumed, 4711U);
    read(bytes);
}

TEST_F(Credential, NullArguments) {
    Bytes bytes = kDenyList;
    const KSTCredential* given = support::asCredential(bytes);
    std::uint8_t target[64];
    std::size_t size = sizeof target;
    const std::pair<KSTStatus, const char*> results[] = {
        {GetSerializedCredentialSize(nullptr, &size), "credential"},
        {GetSerializedCredentialSize(given, nullptr), "outSize"},
        {SerializeCredential(nullptr, target, &size), "credential"},
        {SerializeCredential(given, nullptr, &size), "outBuffer"},
        {SerializeCredential(given, target, nullptr), "outSize"},
        {DeserializeCredential(nullptr, bytes.size(), &credential, &consumed), "buffer"},
        {DeserializeCredential(bytes.data(), bytes.size(), nullptr, &consumed), "credential"},
        {DeserializeCredential(bytes.data(), bytes.size(), &credential, nullptr), "consumedBytes"},
        // Nulls come before sizes.
        {DeserializeCredential(bytes.data(), 0, nullptr, nullptr), "credential"},
        {CopyCredential(nullptr, &credential), "credential"},
        {CopyCredential(given, nullptr), "copy"},
    };
    Lines lines;
    for (const auto& [status, name] : results) {
        EXPECT_EQ(status, -3) << name;
        lines.push_back(failedCheck(name));
    }
    DeallocCredential(nullptr);
    lines.push_back(failedCheck("credential"));
    expectLogged(lines);
    EXPECT_EQ(credential, nullptr);
    EXPECT_EQ(size, sizeof target);
}
