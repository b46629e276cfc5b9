#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/LibCall.h"
#include "tests/common/CredentialSamples.h"
#include "tests/support/ScriptedGate.h"
#include "wire/CredentialFields.h"

#include <gtest/gtest.h>

#include <optional>

namespace {

using support::Bytes;
using support::credentialBytes;
using support::Lines;
using support::ScriptedGate;

/// One property in one type that has it.
struct Property {
    std::uint32_t id;
    std::uint32_t type;
    /// In the whole record.
    std::size_t offset;
    std::size_t length;
    std::string lengthCheck;
    std::string typeCheck;
};

const std::string kIs = "credential->type == kKSTCredentialType";
const std::string kHas = "dataLength == ";

const std::vector<Property> kProperties = {
    {100, 1, 32 + 12, 16, kHas + "16", kIs + "BiometryMatched"},
    {100, 3, 32 + 72, 16, kHas + "16", kIs + "BiometryMatched"},
    {100, 9, 32 + 8, 16, kHas + "16", kIs + "BiometryMatched"},
    {101, 1, 32, 4, kHas + "sizeof(uint32_t)", kIs + "PasscodeValidated2"},
    {101, 3, 32, 4, kHas + "sizeof(uint32_t)", kIs + "PasscodeValidated2"},
    {101, 9, 32, 4, kHas + "sizeof(uint32_t)", kIs + "PasscodeValidated2"},
    {101, 10, 32, 4, kHas + "sizeof(uint32_t)", kIs + "PasscodeValidated2"},
    {102, 1, 32 + 4, 4, kHas + "sizeof(int32_t)", kIs + "PasscodeValidated"},
    {201, 2, 32, 4, kHas + "sizeof(KSTPassphrasePurpose)", kIs + "PassphraseEntered"},
    {300, 3, 32 + 4, 16, kHas + "16", kIs + "BiometryMatched"},
    {301, 3, 32 + 36, 32, kHas + "32", kIs + "BiometryMatched"},
    {302, 3, 32 + 20, 16, kHas + "16", kIs + "BiometryMatched"},
    {400, 7, 32, 32, kHas + "32", kIs + "UserOutputDisplayed"},
    {401, 7, 32 + 32, 24, kHas + "24", kIs + "UserOutputDisplayed"},
    {501, 10, 32 + 4, 16, kHas + "sizeof(uuid_t)", kIs + "PasscodeValidated2"},
    {502, 10, 32 + 20, 16, kHas + "sizeof(uuid_t)", kIs + "PasscodeValidated2"},
    {601, 12, 32, 4, kHas + "sizeof(KSTKextDenyListFormat)", kIs + "KextDenyList"},
    {602, 12, 32 + 4, 4, kHas + "sizeof(KSTKextDenyListRevision)", kIs + "KextDenyList"},
};

constexpr std::uint32_t kUnknownIds[] = {0,   6,   99,  103, 199, 202, 299,        303,
                                         399, 402, 500, 503, 600, 603, 0x80000000, 0xffffffff};

class CredentialProperties : public support::SerializationFixture {
  protected:
    static std::string libCallCheck(const std::string& condition) {
        return "KST: AssertMacros: " + condition + " (value: 0x0),  file: common/LibCall:<n>\n";
    }

    /// Sets a property of the record `bytes`, which must be refused for `condition`.
    void expectSetRefused(Bytes& bytes, std::uint32_t id, const void* data, std::size_t length,
                          const std::string& condition) {
        const Bytes before = bytes;
        EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), id, data, length),
                  -3);
        EXPECT_EQ(bytes, before);
        expectLogged({libCallCheck(condition)});
        ++refusals;
    }

    void expectGetRefused(Bytes& bytes, std::uint32_t id, const std::string& condition) {
        const void* data = this;
        std::size_t length = 4711;
        EXPECT_EQ(
            LibCall_KSTCredentialGetPropertyData(support::asCredential(bytes), id, &data, &length),
            -3);
        EXPECT_EQ(data, this);
        EXPECT_EQ(length, 4711U);
        expectLogged({libCallCheck(condition)});
    }

    /// Where a property of the record is and how long; no offset for a null pointer.
    struct Found {
        std::optional<std::ptrdiff_t> offset;
        std::size_t length;
        bool operator==(const Found&) const = default;
    };

    static Found found(Bytes& bytes, std::uint32_t id) {
        const void* data = &bytes;
        std::size_t length = 4711;
        EXPECT_EQ(
            LibCall_KSTCredentialGetPropertyData(support::asCredential(bytes), id, &data, &length),
            0);
        if (data == nullptr) {
            return {std::nullopt, length};
        }
        return {static_cast<const std::uint8_t*>(data) - bytes.data(), length};
    }

    int refusals = 0;
};

Bytes fresh(std::uint32_t type) {
    KSTCredential* credential = nullptr;
    EXPECT_EQ(LibCall_KSTCredentialCreate(type, &credential), 0);
    const auto* first = reinterpret_cast<const std::uint8_t*>(credential);
    Bytes bytes(first, first + 32 + credential->dataLength);
    LibCall_KSTCredentialDelete(credential);
    return bytes;
}

} // namespace

TEST_F(CredentialProperties, NewCredentials) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        const std::uint32_t length = support::kCredentialDataSizes.at(type - 1);
        Bytes expected(32 + std::size_t{length});
        support::putU32(expected, 0, type);
        support::putU32(expected, 4, 1);
        support::putU32(expected, 12, 0xffffffffU);
        support::putU32(expected, 28, length);
        const ScriptedGate gate;
        EXPECT_EQ(fresh(type), expected);
        EXPECT_EQ(gate.asked, std::vector<std::size_t>{expected.size()});
        EXPECT_EQ(gate.freed, gate.asked);
        EXPECT_TRUE(gate.everyFreeWasWiped);
    }
    expectLogged({});
    EXPECT_EQ(printed(), "");
}

TEST_F(CredentialProperties, CreateRefuses) {
    KSTCredential* credential = nullptr;
    std::string lines;
    for (const std::uint32_t type : support::kTypesOutside) {
        EXPECT_EQ(LibCall_KSTCredentialCreate(type, &credential), -3);
        expectLogged({libCallCheck("0")});
        lines += "KST: LibCall_KSTCredentialCreate: returning, err = -3.\n";
    }
    EXPECT_EQ(LibCall_KSTCredentialCreate(0, nullptr), -3);
    expectLogged({libCallCheck("credential")});
    lines += "KST: LibCall_KSTCredentialCreate: returning, err = -3.\n";
    {
        const ScriptedGate gate(0);
        EXPECT_EQ(LibCall_KSTCredentialCreate(2, &credential), -4);
        EXPECT_EQ(gate.asked, std::vector<std::size_t>{168});
    }
    expectLogged({libCallCheck("cred")});
    lines += "KST: LibCall_KSTCredentialCreate: returning, err = -4.\n";
    EXPECT_EQ(credential, nullptr);
    EXPECT_EQ(printed(), lines);
}

TEST_F(CredentialProperties, Type) {
    Bytes bytes = credentialBytes(9);
    EXPECT_EQ(LibCall_KSTCredentialGetType(support::asCredential(bytes)), 9U);
    EXPECT_EQ(LibCall_KSTCredentialGetType(nullptr), 0U);
    LibCall_KSTCredentialDelete(nullptr);
    expectLogged({libCallCheck("credential"), libCallCheck("credential")});
    EXPECT_EQ(printed(), "");
}

TEST_F(CredentialProperties, HeaderProperties) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        Bytes bytes = credentialBytes(type);
        EXPECT_EQ(found(bytes, 1), (Found{16, 8}));
        EXPECT_EQ(found(bytes, 2), (Found{24, 4}));
        EXPECT_EQ(found(bytes, 3), (Found{0, 4}));
        EXPECT_EQ(found(bytes, 4), (Found{4, 4}));
        EXPECT_EQ(found(bytes, 5), (Found{12, 4}));
        EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 5, "\1\2\3\4", 4),
                  0);
        Bytes expected = credentialBytes(type);
        support::putU32(expected, 12, 0x04030201);
        EXPECT_EQ(bytes, expected);
    }
    Bytes bytes = credentialBytes(4);
    const std::uint8_t data[8] = {};
    for (std::uint32_t id = 1; id <= 4; ++id) {
        expectSetRefused(bytes, id, data, id == 1 ? 8 : 4, "0");
    }
    expectSetRefused(bytes, 5, data, 3, "dataLength == sizeof(uid_t)");
    expectSetRefused(bytes, 5, data, 5, "dataLength == sizeof(uid_t)");
    expectSetRefused(bytes, 5, nullptr, 0, "dataLength == sizeof(uid_t)");
}

TEST_F(CredentialProperties, EveryPropertyInItsPlace) {
    for (const Property& property : kProperties) {
        SCOPED_TRACE(testing::Message() << property.id << " of type " << property.type);
        Bytes bytes = credentialBytes(property.type);
        const Bytes data(property.length, 0xd7);
        EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), property.id,
                                                   data.data(), data.size()),
                  0);
        Bytes expected = credentialBytes(property.type);
        std::copy(data.begin(), data.end(),
                  expected.begin() + static_cast<std::ptrdiff_t>(property.offset));
        EXPECT_EQ(bytes, expected);
        EXPECT_EQ(found(bytes, property.id),
                  (Found{static_cast<std::ptrdiff_t>(property.offset), property.length}));
    }
    expectLogged({});
    EXPECT_EQ(printed(), "");
}

TEST_F(CredentialProperties, LengthsBesideTheRightOne) {
    const Bytes data(200, 0xd7);
    for (const Property& property : kProperties) {
        SCOPED_TRACE(property.id);
        Bytes bytes = credentialBytes(property.type);
        for (const std::size_t length :
             {property.length - 1, property.length + 1, std::size_t{0x80000000U},
              std::size_t{0xffffffffU} + 1 + property.length}) {
            expectSetRefused(bytes, property.id, data.data(), length, property.lengthCheck);
        }
        expectSetRefused(bytes, property.id, nullptr, 0, property.lengthCheck);
    }
}

TEST_F(CredentialProperties, TypesWithoutTheProperty) {
    const Bytes data(200, 0xd7);
    std::vector<Property> properties = kProperties;
    properties.push_back({200, 2, 40, 128, "", kIs + "PassphraseEntered"});
    for (const Property& property : properties) {
        for (std::uint32_t type = 1; type <= 12; ++type) {
            const bool hasIt =
                std::any_of(properties.begin(), properties.end(), [&](const Property& other) {
                    return other.id == property.id && other.type == type;
                });
            if (hasIt) {
                continue;
            }
            SCOPED_TRACE(testing::Message() << property.id << " of type " << type);
            Bytes bytes = credentialBytes(type);
            expectSetRefused(bytes, property.id, data.data(), property.length, property.typeCheck);
            expectGetRefused(bytes, property.id, property.typeCheck);
        }
    }
}

TEST_F(CredentialProperties, UnknownProperties) {
    const std::uint8_t data[4] = {};
    for (const std::uint32_t id : kUnknownIds) {
        Bytes bytes = credentialBytes(1);
        expectSetRefused(bytes, id, data, 4, "0");
        expectGetRefused(bytes, id, "0");
    }
    std::string lines;
    for (int i = 0; i < refusals; ++i) {
        lines += "KST: LibCall_KSTCredentialSetProperty: returning, err = -3.\n"
                 "KST: LibCall_KSTCredentialGetPropertyData: returning, err = -3.\n";
    }
    EXPECT_EQ(printed(), lines);
}

TEST_F(CredentialProperties, IdentifierOfZerosReadsAsNone) {
    for (const std::uint32_t type : {1U, 3U, 9U}) {
        Bytes bytes = fresh(type);
        EXPECT_EQ(found(bytes, 100), (Found{std::nullopt, 0}));
        Bytes data(16);
        for (const std::size_t set : {0U, 15U}) {
            data.assign(16, 0);
            data[set] = 1;
            EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 100,
                                                       data.data(), 16),
                      0);
            EXPECT_EQ(found(bytes, 100).length, 16U);
        }
        data.assign(16, 0);
        EXPECT_EQ(
            LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 100, data.data(), 16),
            0);
        EXPECT_EQ(found(bytes, 100), (Found{std::nullopt, 0}));
    }
    Bytes bytes = fresh(3);
    // Only that one.
    EXPECT_EQ(found(bytes, 300), (Found{36, 16}));
}

TEST_F(CredentialProperties, Passphrase) {
    Bytes bytes = fresh(2);
    EXPECT_EQ(found(bytes, 200), (Found{40, 0}));
    const Bytes data(129, 0xd7);
    for (const std::size_t length : {128U, 127U, 5U, 1U}) {
        EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 200, data.data(),
                                                   length),
                  0);
        Bytes expected = fresh(2);
        support::putU32(expected, 36, static_cast<std::uint32_t>(length));
        // Nothing is left of the longer one before.
        std::fill_n(expected.begin() + 40, length, std::uint8_t{0xd7});
        EXPECT_EQ(bytes, expected);
        EXPECT_EQ(found(bytes, 200), (Found{40, length}));
    }
    EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 200, nullptr, 0), 0);
    EXPECT_EQ(bytes, fresh(2));
    for (const std::size_t length : {std::size_t{129}, std::size_t{0x80000000U}, SIZE_MAX}) {
        expectSetRefused(bytes, 200, data.data(), length, "dataLength <= 128");
    }
}

TEST_F(CredentialProperties, StoredPassphraseLengthAbove128) {
    Bytes bytes = credentialBytes(2);
    for (const std::uint32_t length : {128U, 129U, 0x80000000U, 0xffffffffU}) {
        support::putU32(bytes, 36, length);
        EXPECT_EQ(found(bytes, 200), (Found{40, 128}));
    }
}

TEST_F(CredentialProperties, PassphraseLengthIsNeverMoreThanTheDataHas) {
    Bytes bytes = credentialBytes(2);
    support::putU32(bytes, 36, 128);
    for (const std::uint32_t room : {0U, 1U, 127U, 128U}) {
        support::putU32(bytes, 28, 8 + room);
        EXPECT_EQ(wire::passphraseLength(support::asCredential(bytes)), room);
    }
    // Too short for the length itself.
    for (std::uint32_t dataLength = 0; dataLength < 8; ++dataLength) {
        support::putU32(bytes, 28, dataLength);
        EXPECT_EQ(wire::passphraseLength(support::asCredential(bytes)), 0U) << dataLength;
    }
}

TEST_F(CredentialProperties, DataMayBeThePropertyItself) {
    Bytes bytes = credentialBytes(2);
    support::putU32(bytes, 36, 128);
    EXPECT_EQ(LibCall_KSTCredentialSetProperty(support::asCredential(bytes), 200, &bytes[41], 3),
              0);
    EXPECT_EQ(Bytes(bytes.begin() + 40, bytes.begin() + 44), (Bytes{41, 42, 43, 0}));
}

TEST_F(CredentialProperties, DataAreaTooShort) {
    const char* check = "offset + length <= credential->dataLength";
    const Bytes data(128, 0xd7);
    for (const Property& property : kProperties) {
        SCOPED_TRACE(property.id);
        const auto end = static_cast<std::uint32_t>(property.offset + property.length - 32);
        for (const std::uint32_t length : {0U, end - 1}) {
            Bytes bytes = credentialBytes(property.type, length);
            expectSetRefused(bytes, property.id, data.data(), property.length, check);
            expectGetRefused(bytes, property.id, check);
        }
        Bytes bytes = credentialBytes(property.type, end);
        EXPECT_EQ(found(bytes, property.id).length, property.length);
    }
    Bytes bytes = credentialBytes(2, 135);
    expectSetRefused(bytes, 200, data.data(), 1, check);
    expectGetRefused(bytes, 200, check);
}

TEST_F(CredentialProperties, ArgumentsThatDoNotAgree) {
    Bytes bytes = credentialBytes(1);
    const std::uint8_t data[16] = {};
    const char* check = "(data && dataLength) || (!data && !dataLength)";
    expectSetRefused(bytes, 100, data, 0, check);
    expectSetRefused(bytes, 100, nullptr, 16, check);
    expectSetRefused(bytes, 1, nullptr, 8, check);

    const void* out = nullptr;
    std::size_t length = 0;
    KSTCredential* credential = support::asCredential(bytes);
    EXPECT_EQ(LibCall_KSTCredentialSetProperty(nullptr, 100, nullptr, 16), -3);
    EXPECT_EQ(LibCall_KSTCredentialGetPropertyData(nullptr, 100, &out, &length), -3);
    EXPECT_EQ(LibCall_KSTCredentialGetPropertyData(credential, 100, nullptr, &length), -3);
    EXPECT_EQ(LibCall_KSTCredentialGetPropertyData(credential, 100, &out, nullptr), -3);
    expectLogged({libCallCheck("credential"), libCallCheck("credential"), libCallCheck("data"),
                  libCallCheck("dataLength")});
    EXPECT_EQ(out, nullptr);
    EXPECT_EQ(length, 0U);
}
