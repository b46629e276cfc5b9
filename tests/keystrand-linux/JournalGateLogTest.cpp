#include "keystrand-linux/JournalGateLog.h"

#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <set>
#include <sys/uio.h>
#include <vector>

namespace {

std::vector<std::string> sentFields;
/// What sending a message returns.
int answerOfJournal = 0;

} // namespace

// The linker puts this in the place of the init system's library.
// NOLINTNEXTLINE(bugprone-reserved-identifier)
extern "C" int __wrap_sd_journal_sendv(const iovec* parts, int count) {
    sentFields.clear();
    for (int i = 0; i < count; ++i) {
        sentFields.emplace_back(static_cast<const char*>(parts[i].iov_base), parts[i].iov_len);
    }
    return answerOfJournal;
}

namespace keystrand::usb {
namespace {

using Target = JournalGateLog::Target;

class JournalGateLogTest : public testing::Test {
  protected:
    JournalGateLogTest() {
        sentFields.clear();
        answerOfJournal = 0;
    }

    static std::string standardErrorOf(Target target, const std::string& text) {
        testing::internal::CaptureStderr();
        JournalGateLog(target).write(GateLine::refused, text);
        return testing::internal::GetCapturedStderr();
    }
};

TEST(GateLineClasses, EachClassIsInItsPlaceWithAnIdentifierOfItsOwn) {
    std::set<std::string_view> identifiers;
    for (std::size_t i = 0; i < kGateLineClasses.size(); ++i) {
        EXPECT_EQ(static_cast<std::size_t>(kGateLineClasses[i].about), i);
        EXPECT_THAT(std::string(kGateLineClasses[i].messageId), testing::MatchesRegex("[0-9a-f]+"));
        EXPECT_EQ(kGateLineClasses[i].messageId.size(), 32U);
        identifiers.insert(kGateLineClasses[i].messageId);
    }
    EXPECT_EQ(identifiers.size(), kGateLineClasses.size());
    EXPECT_EQ(static_cast<std::size_t>(GateLine::administrator) + 1, kGateLineClasses.size());
    EXPECT_EQ(classOf(GateLine::policyOff).about, GateLine::policyOff);
}

TEST_F(JournalGateLogTest, TheJournalGetsTheLineItsClassAndItsLevel) {
    EXPECT_EQ(standardErrorOf(Target::journal, "keystrand: refused 1-2"), "");
    EXPECT_THAT(sentFields, testing::ElementsAre(
                                "MESSAGE=keystrand: refused 1-2",
                                "MESSAGE_ID=" + std::string(classOf(GateLine::refused).messageId),
                                "PRIORITY=5", "SYSLOG_IDENTIFIER=keystrand"));
    JournalGateLog(Target::journal).write(GateLine::writeFailed, "a\nb=c");
    EXPECT_THAT(sentFields, testing::Contains("MESSAGE=a\nb=c"));
    EXPECT_THAT(sentFields, testing::Contains("PRIORITY=4"));
}

TEST_F(JournalGateLogTest, WhatTheJournalDoesNotTakeIsWrittenToStandardError) {
    answerOfJournal = -ENOBUFS;
    EXPECT_EQ(standardErrorOf(Target::journal, "keystrand: refused 1-2"),
              "keystrand: refused 1-2\n");
    EXPECT_FALSE(sentFields.empty());
}

TEST_F(JournalGateLogTest, WithoutAJournalALineGoesToStandardErrorAlone) {
    EXPECT_EQ(standardErrorOf(Target::standardError, "keystrand: refused 1-2"),
              "keystrand: refused 1-2\n");
    EXPECT_TRUE(sentFields.empty());
}

TEST_F(JournalGateLogTest, OnlyTheMachineItselfAndOnlyWithAJournalIsToldToTheJournal) {
    const support::TemporaryDirectory directory;
    const std::string there = directory.path();
    EXPECT_EQ(JournalGateLog::targetFor("/", there.c_str()), Target::journal);
    EXPECT_EQ(JournalGateLog::targetFor("/", directory.file("socket").c_str()),
              Target::standardError);
    EXPECT_EQ(JournalGateLog::targetFor(there, there.c_str()), Target::standardError);
}

} // namespace
} // namespace keystrand::usb
