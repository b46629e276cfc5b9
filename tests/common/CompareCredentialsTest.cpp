#include "KSTLib/CredentialSerialization.h"
#include "tests/common/CredentialSamples.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::credentialBytes;

struct Range {
    std::size_t begin;
    std::size_t end;
};

/// Which bytes of a record count.
struct Comparison {
    std::uint32_t type;
    std::vector<Range> compared;
};

const std::vector<Comparison> kComparisons = {
    {1, {{0, 32}, {32 + 12, 32 + 28}}},
    {2, {{0, 4}, {28, 32}, {32, 32 + 4}, {32 + 4, 32 + 8}, {32 + 8, 32 + 8 + 5}}},
    {3, {{0, 32}, {32 + 72, 32 + 88}}},
    {4, {{0, 32}}},
    {5, {{0, 32}}},
    {6, {{0, 32}}},
    {7, {{0, 32 + 56}}},
    {8, {{0, 32}}},
    {9, {{0, 32}, {32 + 8, 32 + 24}}},
    {10, {{0, 32}, {32 + 4, 32 + 36}}},
    {11, {{0, 32}}},
    {12, {{0, 40}}},
};

class CompareCredentials : public support::SerializationFixture {
  protected:
    /// 0 or 1.
    static int areEqual(Bytes a, Bytes b) {
        std::uint8_t equal = 77;
        EXPECT_EQ(::CompareCredentials(support::asCredential(a), support::asCredential(b), &equal),
                  0);
        std::uint8_t reversed = 77;
        EXPECT_EQ(
            ::CompareCredentials(support::asCredential(b), support::asCredential(a), &reversed), 0);
        EXPECT_EQ(equal, reversed);
        return equal;
    }

    static Bytes passphrase(std::uint32_t length) {
        Bytes bytes = credentialBytes(2);
        support::putU32(bytes, 32 + 4, length);
        return bytes;
    }

    static Bytes sample(std::uint32_t type) {
        return type == 2 ? passphrase(5) : credentialBytes(type);
    }
};

} // namespace

TEST_F(CompareCredentials, EveryByteOfEveryType) {
    for (const Comparison& comparison : kComparisons) {
        const Bytes bytes = sample(comparison.type);
        EXPECT_EQ(areEqual(bytes, bytes), 1);
        for (std::size_t i = 0; i < bytes.size(); ++i) {
            bool compared = false;
            for (const Range& range : comparison.compared) {
                compared = compared || (i >= range.begin && i < range.end);
            }
            // A changed length is a record of another length.
            Bytes changed = bytes;
            changed[i] = static_cast<std::uint8_t>(changed[i] ^ 0x40U);
            EXPECT_EQ(areEqual(bytes, changed), compared ? 0 : 1)
                << "type " << comparison.type << ", byte " << i;
        }
    }
    expectLogged({});
}

TEST_F(CompareCredentials, PassphrasesByTheirOwnLengths) {
    EXPECT_EQ(areEqual(passphrase(0), passphrase(0)), 1);
    EXPECT_EQ(areEqual(passphrase(0), passphrase(1)), 0);
    EXPECT_EQ(areEqual(passphrase(127), passphrase(128)), 0);
    Bytes other = passphrase(128);
    EXPECT_EQ(areEqual(passphrase(128), other), 1);
    other.back() = 0;
    EXPECT_EQ(areEqual(passphrase(128), other), 0);
    support::putU32(other, 36, 127);
    EXPECT_EQ(areEqual(passphrase(127), other), 1);
}

TEST_F(CompareCredentials, LengthsCountAsStoredAndOfTheBytesAtMost128) {
    for (const std::uint32_t length : {128U, 129U, 0x80000000U, 0xffffffffU}) {
        SCOPED_TRACE(length);
        EXPECT_EQ(areEqual(passphrase(length), passphrase(length)), 1);
        EXPECT_EQ(areEqual(passphrase(length - 1), passphrase(length)), 0);
        EXPECT_EQ(areEqual(passphrase(127), passphrase(length)), 0);
        Bytes other = passphrase(length);
        other.back() = 0;
        EXPECT_EQ(areEqual(passphrase(length), other), 0);
        // What stands behind the 128 bytes is no part of the passphrase.
        Bytes longer = passphrase(length);
        Bytes another = passphrase(length);
        for (Bytes* bytes : {&longer, &another}) {
            bytes->resize(bytes->size() + 8, bytes == &longer ? 1 : 2);
            support::putU32(*bytes, 28, 136 + 8);
        }
        EXPECT_EQ(areEqual(longer, another), 1);
    }
}

TEST_F(CompareCredentials, DataAreasShorterThanTheType) {
    for (std::uint32_t type = 1; type <= 12; ++type) {
        const std::uint32_t right = support::kCredentialDataSizes.at(type - 1);
        for (std::uint32_t length = 0; length < right; ++length) {
            SCOPED_TRACE(testing::Message() << "type " << type << ", length " << length);
            Bytes bytes = credentialBytes(type, length);
            if (type == 2 && length >= 8) {
                support::putU32(bytes, 36, 0xffffffffU);
            }
            EXPECT_EQ(areEqual(bytes, bytes), 1);
        }
    }
    // The last byte that is there counts.
    Bytes bytes = credentialBytes(1, 20);
    Bytes other = bytes;
    other.back() = 0;
    EXPECT_EQ(areEqual(bytes, other), 0);
}

TEST_F(CompareCredentials, DataAreasLongerThanTheType) {
    for (const Comparison& comparison : kComparisons) {
        SCOPED_TRACE(comparison.type);
        const std::size_t size = sample(comparison.type).size();
        Bytes longer = sample(comparison.type);
        longer.resize(size + 8, 1);
        support::putU32(longer, 28, static_cast<std::uint32_t>(size + 8 - 32));
        Bytes other = longer;
        other.at(size) = 2;
        // What stands behind the type's own data counts where the whole record does.
        const bool whole = comparison.type == 12 || comparison.compared.back().end == 32;
        EXPECT_EQ(areEqual(longer, other), whole ? 0 : 1);
    }
}

TEST_F(CompareCredentials, BytesBehindAPassphraseDoNotCount) {
    for (const std::uint32_t length : {0U, 1U, 127U}) {
        Bytes other = passphrase(length);
        other.at(32 + 8 + length) ^= 0x40U;
        EXPECT_EQ(areEqual(passphrase(length), other), 1);
    }
}

TEST_F(CompareCredentials, DifferentTypesOrLengths) {
    EXPECT_EQ(areEqual(credentialBytes(4), credentialBytes(5)), 0);
    EXPECT_EQ(areEqual(credentialBytes(4, 0), credentialBytes(4, 1)), 0);
    // They differ before the type is looked at.
    EXPECT_EQ(areEqual(credentialBytes(0, 0), credentialBytes(13, 0)), 0);
    expectLogged({});
}

TEST_F(CompareCredentials, TypesOutside) {
    for (const std::uint32_t type : support::kTypesOutside) {
        Bytes bytes = credentialBytes(type, 0);
        std::uint8_t equal = 77;
        const KSTCredential* credential = support::asCredential(bytes);
        EXPECT_EQ(::CompareCredentials(credential, credential, &equal), -3);
        EXPECT_EQ(equal, 77);
        expectLogged({failedCheck("0")});
    }
}

TEST_F(CompareCredentials, NullArguments) {
    Bytes bytes = credentialBytes(4);
    const KSTCredential* credential = support::asCredential(bytes);
    std::uint8_t equal = 77;
    EXPECT_EQ(::CompareCredentials(nullptr, credential, &equal), -3);
    EXPECT_EQ(::CompareCredentials(credential, nullptr, &equal), -3);
    EXPECT_EQ(::CompareCredentials(credential, credential, nullptr), -3);
    EXPECT_EQ(equal, 77);
    expectLogged({failedCheck("credential1"), failedCheck("credential2"), failedCheck("equal")});
}

TEST_F(CompareCredentials, DataBlobs) {
    const Bytes a = {1, 2, 3};
    const Bytes b = {1, 2, 4};
    EXPECT_EQ(CompareDataBlobs(a.data(), 3, a.data(), 3), 1);
    EXPECT_EQ(CompareDataBlobs(a.data(), 3, b.data(), 3), 0);
    EXPECT_EQ(CompareDataBlobs(a.data(), 2, b.data(), 2), 1);
    EXPECT_EQ(CompareDataBlobs(a.data(), 2, a.data(), 3), 0);
    EXPECT_EQ(CompareDataBlobs(a.data(), 0, b.data(), 0), 1);
    EXPECT_EQ(CompareDataBlobs(nullptr, 0, nullptr, 0), 1);
    EXPECT_EQ(CompareDataBlobs(nullptr, 3, nullptr, 3), 1);
    EXPECT_EQ(CompareDataBlobs(nullptr, 0, nullptr, 1), 0);
    EXPECT_EQ(CompareDataBlobs(nullptr, 3, a.data(), 3), 0);
    EXPECT_EQ(CompareDataBlobs(a.data(), 0, nullptr, 0), 0);
    expectLogged({});
}
