#include "platform/linux/alarms/HelpedAlarmWaker.h"

#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/alarms/FakeAlarmHelper.h"
#include "tests/platform/linux/alarms/FakeAlarmWaker.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <vector>

namespace platform {
namespace {

using Calls = std::vector<std::string>;
using Timer = wire::AlarmAnswer::Timer;

constexpr Date kDate{4'102'444'800'000'000'000};
constexpr Date kOther{kDate.nanosecondsSince1970 + 1};
const std::string kArm = "arm " + std::to_string(kDate.nanosecondsSince1970);

/// The helper's socket, and the helper as far as it answers.
class HelpedAlarmWakerTest : public testing::Test {
  protected:
    using Question = FakeAlarmHelper::Question;

    void listen() { helper.emplace(directory.file("alarms.sock")); }

    [[nodiscard]] std::optional<Question> question() const { return helper->question(); }

    static void answer(const Question& asked, const wire::AlarmAnswer& words) {
        asked.answer(words);
    }
    static wire::AlarmAnswer waitsFor(Date date) {
        return {Timer::waits, true, date.nanosecondsSince1970, {}};
    }

    /// Lets the waker look at what has come.
    void turn() { static_cast<void>(loop.runOnce({0})); }

    /// Lets the time pass in which the helper may answer.
    void losePatience() {
        while (log.texts().empty() && loop.runOnce(kDistantFuture)) {
        }
    }

    static std::string waitsItself(const std::string& reason) {
        return "kstd: AlarmWaker: no timer of the init system: " + reason +
               "; the daemon stays to wait for its alarm.";
    }

    /// One whose patience never ends in this test, or ends at once.
    [[nodiscard]] HelpedAlarmWaker
    make(std::chrono::microseconds patience = std::chrono::hours(1)) {
        return {directory.file("alarms.sock"), loop, inProcess, log, patience};
    }

    support::TemporaryDirectory directory;
    FakeSystemLog log;
    LinuxRunLoop loop{log};
    FakeAlarmWaker inProcess;
    std::optional<FakeAlarmHelper> helper;

  private:
    // The loop has a reason to run.
    base::FileDescriptor never_{::eventfd(0, EFD_CLOEXEC)};
    std::unique_ptr<RunLoopSource> source_ = loop.addReadable(never_.get(), [] {});
};

TEST_F(HelpedAlarmWakerTest, ThisProcessWaitsUntilTheHelperHasConfirmedTheVeryDate) {
    listen();
    auto waker = make();
    waker.arm(kDate);
    EXPECT_EQ(inProcess.takeCalls(), Calls{kArm});
    const auto asked = question();
    ASSERT_TRUE(asked && asked->answers.isOpen());
    turn();
    EXPECT_EQ(inProcess.takeCalls(), Calls{});
    answer(*asked, waitsFor(kDate));
    turn();
    EXPECT_EQ(inProcess.takeCalls(), Calls{"disarm"});
    EXPECT_TRUE(log.texts().empty());
    EXPECT_FALSE(question()) << "it is told once";
}

TEST_F(HelpedAlarmWakerTest, HoldsTheProcessAsTheOtherWakerDoes) {
    auto waker = make();
    EXPECT_FALSE(waker.holdsProcess());
    inProcess.holds = true;
    EXPECT_TRUE(waker.holdsProcess());
}

TEST_F(HelpedAlarmWakerTest, AnswerThatConfirmsNothingLeavesTheAlarmToThisProcess) {
    const std::pair<wire::AlarmAnswer, std::string> answers[] = {
        {waitsFor(kOther), "its helper does not find the alarm on disk"},
        {{Timer::none, true, kDate.nanosecondsSince1970, {}},
         "its helper does not find the alarm on disk"},
        {{Timer::failed, true, kDate.nanosecondsSince1970, "Access denied"}, "Access denied"},
    };
    listen();
    for (const auto& [wrong, reason] : answers) {
        auto waker = make(std::chrono::microseconds(1));
        waker.arm(kDate);
        answer(question().value(), wrong);
        losePatience();
        EXPECT_EQ(log.texts(), Calls{waitsItself(reason)});
        EXPECT_EQ(inProcess.takeCalls(), Calls{kArm});
        log.clear();
    }
}

TEST_F(HelpedAlarmWakerTest, HelperThatSaysNothingOrNonsenseIsNamed) {
    listen();
    const std::vector<std::uint8_t> tooLong(wire::kAlarmAnswerMaxSize + 1, 1);
    const std::pair<std::function<void(Question)>, std::string> helpers[] = {
        {[](Question) {}, "its helper has ended without an answer"},
        {[](Question asked) {
             asked.answer(std::vector<std::uint8_t>{1, 2});
         },
         "its helper's answer is malformed"},
        {[&](Question asked) { asked.answer(tooLong); }, "its helper's answer is malformed"},
    };
    for (const auto& [help, reason] : helpers) {
        auto waker = make(std::chrono::microseconds(1));
        waker.arm(kDate);
        help(std::move(question().value()));
        losePatience();
        EXPECT_EQ(log.texts(), Calls{waitsItself(reason)});
        EXPECT_EQ(inProcess.takeCalls(), Calls{kArm});
        log.clear();
    }
    auto waker = make(std::chrono::microseconds(1));
    waker.arm(kDate);
    losePatience();
    EXPECT_EQ(log.texts(), Calls{waitsItself("its helper does not answer")});
}

TEST_F(HelpedAlarmWakerTest, HelperThatCannotBeToldIsNamed) {
    const auto reasonGiven = [this] {
        log.clear();
        auto waker = make(std::chrono::microseconds(1));
        waker.arm(kDate);
        losePatience();
        return log.texts();
    };
    EXPECT_EQ(reasonGiven(), Calls{waitsItself("No such file or directory")});
    listen();
    for (int i = 0; i < 100000 && reasonGiven().front().find("helper") != std::string::npos; ++i) {
    }
    EXPECT_EQ(log.texts(), Calls{waitsItself("Resource temporarily unavailable")});
    helper.reset();
    EXPECT_EQ(reasonGiven(), Calls{waitsItself("Connection refused")});
    auto far =
        HelpedAlarmWaker(std::string(200, 'x'), loop, inProcess, log, std::chrono::microseconds(1));
    log.clear();
    far.arm(kDate);
    losePatience();
    EXPECT_EQ(log.texts(), Calls{waitsItself("the socket's path is too long")});
}

TEST_F(HelpedAlarmWakerTest, AnswerOfAnotherUserDoesNotCount) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root";
    }
    listen();
    auto waker = make(std::chrono::microseconds(1));
    waker.arm(kDate);
    const auto asked = question();
    EXPECT_EQ(support::exitStatusOfChild([&] {
                  if (::setuid(65534) != 0) {
                      return 1;
                  }
                  answer(*asked, waitsFor(kDate));
                  return 0;
              }),
              0);
    losePatience();
    EXPECT_EQ(log.texts(), Calls{waitsItself("somebody else answers in the place of its helper")});
    EXPECT_EQ(inProcess.takeCalls(), Calls{kArm});
}

TEST_F(HelpedAlarmWakerTest, AnswerToAnEarlierQuestionDoesNotCount) {
    listen();
    auto waker = make();
    waker.arm(kDate);
    const auto first = question();
    waker.arm(kOther);
    const auto second = question();
    const auto bytes = wire::encodeAlarmAnswer(waitsFor(kDate));
    EXPECT_LT(::send(first->answers.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL), 0);
    answer(*second, waitsFor(kOther));
    turn();
    EXPECT_EQ(inProcess.takeCalls(),
              (Calls{kArm, "arm " + std::to_string(kOther.nanosecondsSince1970), "disarm"}));
}

TEST_F(HelpedAlarmWakerTest, SaysOnceThatItWaitsUntilTheTimerStood) {
    listen();
    auto waker = make(std::chrono::microseconds(1));
    for (int i = 0; i < 3; ++i) {
        waker.arm(kDate);
        losePatience();
    }
    EXPECT_EQ(log.texts().size(), 1U);
    // Once more, with the patience over and a line already there.
    turn();
    EXPECT_EQ(log.texts().size(), 1U);
    while (auto asked = question()) {
        const auto bytes = wire::encodeAlarmAnswer(waitsFor(kDate));
        static_cast<void>(::send(asked->answers.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL));
    }
    turn();
    EXPECT_EQ(inProcess.takeCalls().back(), "disarm");
    log.clear();
    waker.arm(kOther);
    losePatience();
    EXPECT_EQ(log.texts(), Calls{waitsItself("its helper does not answer")});
}

TEST_F(HelpedAlarmWakerTest, AnIdleTimeAsksAgainOnceTheHelperHadItsTime) {
    listen();
    {
        auto waker = make();
        waker.tryAgain();
        EXPECT_FALSE(question()) << "nothing is armed";
        waker.arm(kDate);
        answer(question().value(), {Timer::failed, true, 0, "no"});
        turn();
        waker.tryAgain();
        EXPECT_FALSE(question()) << "it was asked a moment ago";
    }
    auto waker = make(std::chrono::microseconds(1));
    waker.arm(kDate);
    answer(question().value(), {Timer::failed, true, 0, "no"});
    losePatience();
    waker.tryAgain();
    const auto asked = question();
    ASSERT_TRUE(asked);
    answer(*asked, waitsFor(kDate));
    turn();
    EXPECT_EQ(inProcess.takeCalls().back(), "disarm");
    waker.tryAgain();
    EXPECT_FALSE(question()) << "the timer stands";
}

TEST_F(HelpedAlarmWakerTest, DisarmingTellsTheHelperAndWaitsForNothing) {
    listen();
    auto waker = make(std::chrono::microseconds(1));
    waker.arm(kDate);
    ASSERT_TRUE(question());
    waker.disarm();
    const auto asked = question();
    ASSERT_TRUE(asked);
    EXPECT_EQ(inProcess.takeCalls(), (Calls{kArm, "disarm"}));
    answer(*asked, {Timer::failed, true, 0, "no"});
    for (int i = 0; i < 5; ++i) {
        turn();
    }
    waker.tryAgain();
    EXPECT_FALSE(question());
    EXPECT_EQ(inProcess.takeCalls(), Calls{});
    EXPECT_TRUE(log.texts().empty());
}

TEST_F(HelpedAlarmWakerTest, AfterClosingTheHelperIsStillTold) {
    listen();
    auto waker = make();
    waker.arm(kDate);
    const auto asked = question();
    ASSERT_TRUE(asked);
    waker.close();
    EXPECT_EQ(inProcess.takeCalls(), (Calls{kArm, "close"}));
    waker.arm(kOther);
    const auto told = question();
    ASSERT_TRUE(told);
    EXPECT_FALSE(told->answers.isOpen());
    waker.disarm();
    EXPECT_TRUE(question());
}

TEST_F(HelpedAlarmWakerTest, MachineThatCannotBeWokenIsSaidOnce) {
    listen();
    auto waker = make();
    for (const Date date : {kDate, kOther}) {
        waker.arm(date);
        wire::AlarmAnswer doesNotWake = waitsFor(date);
        doesNotWake.wakesMachine = false;
        answer(question().value(), doesNotWake);
        turn();
    }
    EXPECT_EQ(
        log.texts(),
        Calls{"kstd: AlarmWaker: this machine cannot be woken from sleep; an alarm that comes "
              "due meanwhile waits until it is awake."});
    EXPECT_EQ(inProcess.takeCalls().back(), "disarm");
}

TEST_F(HelpedAlarmWakerTest, NoDescriptorStaysOpen) {
    listen();
    // The loop keeps what it needs for timers.
    static_cast<void>(make());
    const std::size_t before = support::countOpenDescriptors();
    {
        auto waker = make();
        for (int i = 0; i < 3; ++i) {
            waker.arm(kDate);
        }
        waker.disarm();
        waker.arm(kDate);
    }
    while (question()) {
    }
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

} // namespace
} // namespace platform
