#include "KSTLib/Command.h"

#include "KSTLib/Status.h"
#include "common/PayloadMemory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <array>
#include <string_view>

TEST(CommandHeader, WritesSevenBytesAndNoMore) {
    std::array<std::uint8_t, 9> frame{};
    frame.fill(0xaa);
    kst::writeCommandHeader(frame.data(), 26, 1, 255);
    EXPECT_THAT(frame, testing::ElementsAre(0x44, 0x52, 0x43, 0x53, 26, 1, 255, 0xaa, 0xaa));
}

TEST(CommandLayout, Offsets) {
    EXPECT_EQ(std::string_view(KST_COMMAND_MAGIC), "DRCS");
    EXPECT_EQ(int{kKSTCommandMagicSize}, 4);
    EXPECT_EQ(int{kKSTCommandCodeOffset}, 4);
    EXPECT_EQ(int{kKSTCommandSecondByteOffset}, 5);
    EXPECT_EQ(int{kKSTCommandThirdByteOffset}, 6);
    EXPECT_EQ(int{kKSTCommandHeaderSize}, 8);
}

TEST(CommandLayout, Codes) {
    EXPECT_EQ(int{kKSTCommandContextCreate}, 1);
    EXPECT_EQ(int{kKSTCommandContextDelete}, 2);
    EXPECT_EQ(int{kKSTCommandVerifyPolicy}, 3);
    EXPECT_EQ(int{kKSTCommandContainsCredentialType}, 4);
    EXPECT_EQ(int{kKSTCommandAddCredential}, 5);
    EXPECT_EQ(int{kKSTCommandRemoveCredentialsByValue}, 6);
    EXPECT_EQ(int{kKSTCommandRemoveCredentialsByType}, 9);
    EXPECT_EQ(int{kKSTCommandVerifyAclConstraint}, 11);
    EXPECT_EQ(int{kKSTCommandContainsPassphraseCredential}, 13);
    EXPECT_EQ(int{kKSTCommandReplacePassphraseCredentials}, 15);
    EXPECT_EQ(int{kKSTCommandRemovePassphraseCredentials}, 16);
    EXPECT_EQ(int{kKSTCommandContextCreateWithExternalForm}, 18);
    EXPECT_EQ(int{kKSTCommandContextGetExternalForm}, 19);
    EXPECT_EQ(int{kKSTCommandParseAcl}, 20);
    EXPECT_EQ(int{kKSTCommandSetEnvironmentVariable}, 24);
    EXPECT_EQ(int{kKSTCommandGetEnvironmentVariable}, 25);
    EXPECT_EQ(int{kKSTCommandKernelControl}, 26);
}

TEST(CommandLayout, SelectorsAndLimits) {
    EXPECT_EQ(int{kKSTSelectorCommand}, 0);
    EXPECT_EQ(int{kKSTSelectorLogLevel}, 2);
    EXPECT_EQ(int{kKSTEnvironmentVariableMaxSize}, 64);
    EXPECT_EQ(int{kKSTKernelControlMaxSize}, 256);
}

TEST(Statuses, Numbers) {
    EXPECT_EQ(int{kKSTErrorSuccess}, 0);
    EXPECT_EQ(int{kKSTErrorBadParameter}, -3);
    EXPECT_EQ(int{kKSTErrorOutOfMemory}, -4);
    EXPECT_EQ(int{kKSTErrorUnexpected}, -5);
    EXPECT_EQ(int{kKSTErrorNotContained}, -7);
}
