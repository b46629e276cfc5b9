#include "keystrand/CredentialSet.h"

#include "KSTLib/AllocatedBytes.h"
#include "tests/keystrand/Credentials.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace keystrand::test {

namespace {

class CredentialSetTest : public testing::Test {
  protected:
    bool add(const ByteVector& bytes, CredentialSet::Seconds now = 0) {
        return set_.add(read(bytes), now);
    }

    /// The types of the members and when they were added.
    using Members = std::vector<std::pair<std::uint32_t, std::uint64_t>>;
    [[nodiscard]] Members members() const {
        Members found;
        for (const auto& member : set_.members()) {
            found.emplace_back(member.credential->type, member.addedAt);
        }
        return found;
    }

    /// As many different credentials as there may be, none of them a passphrase.
    void fill() {
        for (std::uint32_t user = 0; set_.members().size() < CredentialSet::kMaxCount; ++user) {
            ASSERT_TRUE(add(plainCredential(4, user)));
        }
    }

    CredentialSet set_;
};

TEST_F(CredentialSetTest, AddedCredentialIsThere) {
    ASSERT_TRUE(add(plainCredential(3), 5));
    ASSERT_TRUE(add(plainCredential(4), 6));
    EXPECT_EQ(members(), (Members{{3, 5}, {4, 6}}));
    EXPECT_TRUE(set_.containsType(3));
    EXPECT_FALSE(set_.containsType(1));
}

TEST_F(CredentialSetTest, EqualCredentialIsRenewed) {
    ASSERT_TRUE(add(plainCredential(3), 5));
    ASSERT_TRUE(add(plainCredential(4), 6));
    ASSERT_TRUE(add(plainCredential(3), 7));
    EXPECT_EQ(members(), (Members{{4, 6}, {3, 7}}));
    ASSERT_TRUE(add(plainCredential(3, 1000), 8));
    EXPECT_EQ(members(), (Members{{4, 6}, {3, 7}, {3, 8}}));
}

TEST_F(CredentialSetTest, NoMoreThan64Credentials) {
    fill();
    EXPECT_EQ(set_.members().size(), 64U);
    EXPECT_FALSE(add(plainCredential(5)));
    EXPECT_FALSE(set_.replacePassphrases(read(passphrase("a")), 0));
    EXPECT_EQ(set_.members().size(), 64U);
    EXPECT_TRUE(add(plainCredential(4, 0), 9));
    set_.remove(set_.members().front().credential.get());
    EXPECT_TRUE(set_.replacePassphrases(read(passphrase("a")), 0));
    EXPECT_TRUE(set_.replacePassphrases(read(passphrase("b")), 0));
    EXPECT_FALSE(set_.replacePassphrases(read(passphrase("c", 1)), 0));
}

TEST_F(CredentialSetTest, RemovedByType) {
    ASSERT_TRUE(add(plainCredential(4, 1)) && add(plainCredential(4, 2)) &&
                add(plainCredential(5)));
    set_.removeType(4);
    EXPECT_EQ(members(), (Members{{5, 0}}));
    set_.removeType(4);
    EXPECT_EQ(members(), (Members{{5, 0}}));
}

TEST_F(CredentialSetTest, RemovedByValue) {
    ASSERT_TRUE(add(passphrase("secret")) && add(passphrase("other")) && add(plainCredential(4)));
    set_.removeEqual(*read(passphrase("nothing of this kind")));
    EXPECT_EQ(set_.members().size(), 3U);
    set_.removeEqual(*read(passphrase("secret")));
    EXPECT_EQ(set_.members().size(), 2U);
    set_.removeEqual(*read(plainCredential(4)));
    EXPECT_EQ(members(), (Members{{2, 0}}));
}

TEST_F(CredentialSetTest, PassphrasesByPurpose) {
    ASSERT_TRUE(add(passphrase("a", 1)) && add(passphrase("b", 1)) && add(passphrase("c", 2)));
    ASSERT_TRUE(add(plainCredential(12, kNoUser, 1)));
    EXPECT_TRUE(set_.containsPassphrase(1));
    EXPECT_FALSE(set_.containsPassphrase(0x01010101));
    ASSERT_TRUE(set_.replacePassphrases(read(passphrase("d", 1)), 9));
    EXPECT_EQ(members(), (Members{{2, 0}, {12, 0}, {2, 9}}));
    set_.removePassphrases(1);
    EXPECT_EQ(members(), (Members{{2, 0}, {12, 0}}));
    EXPECT_FALSE(set_.containsPassphrase(1));
    EXPECT_TRUE(set_.containsPassphrase(2));
}

TEST_F(CredentialSetTest, OnlyAPassphraseReplacesPassphrases) {
    ASSERT_TRUE(add(passphrase("a")));
    EXPECT_FALSE(set_.replacePassphrases(read(plainCredential(4)), 0));
    EXPECT_EQ(members(), (Members{{2, 0}}));
}

TEST_F(CredentialSetTest, WhateverGoesIsWipedWhole) {
    const std::int64_t before = gAllocatedBytes;
    support::ScriptedGate gate;
    ASSERT_TRUE(add(passphrase("first")) && add(passphrase("second", 2)));
    ASSERT_TRUE(set_.replacePassphrases(read(passphrase("third", 2)), 0));
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{168}));
    set_.removePassphrases(2);
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{168, 168}));
    set_ = CredentialSet();
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{168, 168, 168}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
    EXPECT_EQ(gAllocatedBytes, before);
}

} // namespace

} // namespace keystrand::test
