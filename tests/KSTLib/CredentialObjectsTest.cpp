#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/support/RecordingBlock.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::Lines;

std::string libCallCheck(const std::string& condition) {
    return "KST: AssertMacros: " + condition + " (value: 0x0),  file: common/LibCall:<n>\n";
}

std::string returning(const std::string& function) {
    return "KSTLib: " + function + ": returning, err = -3.\n";
}

class CredentialObjects : public support::ChannelFixture {
  protected:
    void make(std::uint32_t type) { ASSERT_EQ(KSTCredentialCreate(type, &credential), 0); }

    void TearDown() override {
        if (credential != nullptr) {
            KSTCredentialDelete(credential);
        }
        EXPECT_TRUE(channel.structCalls.empty());
        ChannelFixture::TearDown();
    }

    /// What was logged since the last time.
    Lines newLines() {
        Lines lines = logged();
        log.clear();
        return lines;
    }

    KSTCredential* credential = nullptr;
    support::RecordingBlock block;
};

} // namespace

TEST_F(CredentialObjects, PassphraseIsFilledAndRead) {
    make(kKSTCredentialTypePassphraseEntered);
    EXPECT_EQ(KSTCredentialGetType(credential), 2U);
    EXPECT_EQ(KSTCredentialSetProperty(credential, 200, "secret", 6), 0);
    const KSTPassphrasePurpose purpose = 3;
    EXPECT_EQ(KSTCredentialSetProperty(credential, 201, &purpose, sizeof purpose), 0);

    const void* data = nullptr;
    std::size_t length = 0;
    EXPECT_EQ(KSTCredentialGetPropertyData(credential, 200, &data, &length), 0);
    EXPECT_EQ(data, reinterpret_cast<const std::uint8_t*>(credential) + 40);
    EXPECT_EQ(length, 6U);

    EXPECT_EQ(KSTCredentialGetProperty(credential, 200, block), 0);
    EXPECT_EQ(KSTCredentialGetProperty(credential, 201, block), 0);
    EXPECT_EQ(KSTCredentialGetProperty(credential, 5, block), 0);
    ASSERT_EQ(block.calls.size(), 3U);
    EXPECT_EQ(block.calls[0].bytes, (Bytes{'s', 'e', 'c', 'r', 'e', 't'}));
    EXPECT_EQ(block.calls[1].bytes, (Bytes{3, 0, 0, 0}));
    EXPECT_EQ(block.calls[2].bytes, (Bytes{0xff, 0xff, 0xff, 0xff}));
    EXPECT_EQ(newLines(), Lines());
    EXPECT_EQ(printed(), "");
}

TEST_F(CredentialObjects, NothingIsANullPointerForTheBlock) {
    make(kKSTCredentialTypePassphraseEntered);
    EXPECT_EQ(KSTCredentialGetProperty(credential, 200, block), 0);
    KSTCredentialDelete(credential);
    make(kKSTCredentialTypePasscodeValidated);
    EXPECT_EQ(KSTCredentialGetProperty(credential, 100, block), 0);
    ASSERT_EQ(block.calls.size(), 2U);
    for (const auto& call : block.calls) {
        EXPECT_TRUE(call.wasNull);
        EXPECT_EQ(call.length, 0U);
    }
    KSTCredentialDelete(credential);
    make(kKSTCredentialTypePassphraseEntered);
    EXPECT_EQ(KSTCredentialSetProperty(credential, 200, "x", 1), 0);
    EXPECT_EQ(KSTCredentialGetProperty(credential, 200, block), 0);
    EXPECT_EQ(block.calls.back().bytes, Bytes{'x'});
}

TEST_F(CredentialObjects, Failures) {
    make(kKSTCredentialTypePasscodeValidated);
    const std::uint8_t data[16] = {};
    const void* out = nullptr;
    std::size_t length = 0;
    KSTCredential* made = nullptr;

    EXPECT_EQ(KSTCredentialCreate(13, &made), -3);
    EXPECT_EQ(made, nullptr);
    EXPECT_EQ(newLines(), (Lines{libCallCheck("0"), returning("KSTCredentialCreate")}));

    const std::string typeCheck = libCallCheck("credential->type == "
                                               "kKSTCredentialTypeBiometryMatched");
    EXPECT_EQ(KSTCredentialSetProperty(credential, 300, data, 16), -3);
    EXPECT_EQ(newLines(), (Lines{typeCheck, returning("KSTCredentialSetProperty")}));

    EXPECT_EQ(KSTCredentialGetPropertyData(credential, 300, &out, &length), -3);
    EXPECT_EQ(newLines(), (Lines{typeCheck, returning("KSTCredentialGetPropertyData")}));

    EXPECT_EQ(KSTCredentialGetProperty(credential, 300, block), -3);
    EXPECT_EQ(newLines(), (Lines{typeCheck, returning("KSTCredentialGetPropertyData"),
                                 failedCheck("err == 0 ", "0xfffffffffffffffd"),
                                 returning("KSTCredentialGetProperty")}));
    EXPECT_EQ(KSTCredentialGetProperty(nullptr, 300, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("credential"), returning("KSTCredentialGetProperty")}));
    EXPECT_EQ(KSTCredentialGetProperty(credential, 300, nullptr), -3);
    EXPECT_EQ(newLines(),
              (Lines{failedCheck("processProperty"), returning("KSTCredentialGetProperty")}));
    EXPECT_TRUE(block.calls.empty());

    EXPECT_EQ(KSTCredentialGetType(nullptr), 0U);
    KSTCredentialDelete(nullptr);
    EXPECT_EQ(newLines(), Lines(2, libCallCheck("credential")));
    EXPECT_EQ(printed(), "KST: LibCall_KSTCredentialCreate: returning, err = -3.\n"
                         "KST: LibCall_KSTCredentialSetProperty: returning, err = -3.\n"
                         "KST: LibCall_KSTCredentialGetPropertyData: returning, err = -3.\n"
                         "KST: LibCall_KSTCredentialGetPropertyData: returning, err = -3.\n");
}

TEST_F(CredentialObjects, EntriesAndReturnsAtLevel30) {
    kst::gLogLevel = 30;
    make(4);
    static_cast<void>(KSTCredentialGetType(credential));
    static_cast<void>(KSTCredentialSetProperty(credential, 5, "abcd", 4));
    static_cast<void>(KSTCredentialGetProperty(credential, 5, block));
    KSTCredentialDelete(credential);
    credential = nullptr;
    KSTCredentialDelete(nullptr);
    EXPECT_EQ(newLines(), (Lines{
                              "KSTLib: KSTCredentialCreate: called.\n",
                              "KSTLib: KSTCredentialCreate: returning, err = 0.\n",
                              "KSTLib: KSTCredentialGetType: called.\n",
                              "KSTLib: KSTCredentialGetType: returning.\n",
                              "KSTLib: KSTCredentialSetProperty: called.\n",
                              "KSTLib: KSTCredentialSetProperty: returning, err = 0.\n",
                              "KSTLib: KSTCredentialGetProperty: called.\n",
                              "KSTLib: KSTCredentialGetPropertyData: called.\n",
                              "KSTLib: KSTCredentialGetPropertyData: returning, err = 0.\n",
                              "KSTLib: KSTCredentialGetProperty: returning, err = 0.\n",
                              "KSTLib: KSTCredentialDelete: called.\n",
                              "KSTLib: KSTCredentialDelete: returning.\n",
                              "KSTLib: KSTCredentialDelete: called.\n",
                              libCallCheck("credential"),
                              "KSTLib: KSTCredentialDelete: returning.\n",
                          }));
}
