#include "keystrand/RestrictedModeTimer.h"

#include "tests/keystrand/Records.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace keystrand::test {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::uint64_t kStart = 1'000'000;
constexpr std::uint32_t kPeriod = 3600;
constexpr std::uint32_t kAnalyticsPeriod = 86400;
constexpr std::uint64_t kDue = kStart + kPeriod;

class RestrictedModeTimerTest : public testing::Test {
  protected:
    void lockAtStart() { static_cast<void>(timer_.lock(kStart)); }
    void restrictAtDue() {
        lockAtStart();
        static_cast<void>(timer_.advance(kDue));
        ASSERT_TRUE(timer_.restricted());
    }
    static RestrictedModePolicy allowed(bool isAllowed) {
        RestrictedModePolicy policy;
        policy.allowed = isAllowed;
        return policy;
    }

    RestrictedModeTimer timer_{{.untilRestricted = kPeriod, .analytics = kAnalyticsPeriod}, kStart};
};

TEST_F(RestrictedModeTimerTest, NewTimerIsUnlockedAndAllowed) {
    EXPECT_FALSE(timer_.locked());
    EXPECT_FALSE(timer_.restricted());
    EXPECT_TRUE(timer_.policy().enabled());
    EXPECT_EQ(timer_.nextDeadline(), kStart + kAnalyticsPeriod);
}

TEST_F(RestrictedModeTimerTest, LockAnnouncesTheAlarm) {
    EXPECT_THAT(recordsOf(timer_.lock(kStart)), ElementsAre(timerRestarted(kDue, 1, kStart, 0)));
    EXPECT_EQ(timer_.nextDeadline(), kDue);
}

TEST_F(RestrictedModeTimerTest, LockOnLockedDeviceDoesNothing) {
    lockAtStart();
    EXPECT_THAT(timer_.lock(kStart + 10), IsEmpty());
    EXPECT_EQ(timer_.nextDeadline(), kDue);
}

TEST_F(RestrictedModeTimerTest, UnlockOnUnlockedDeviceDoesNothing) {
    EXPECT_THAT(timer_.unlock(kStart), IsEmpty());
}

TEST_F(RestrictedModeTimerTest, OneSecondBeforeThePeriodEndsNothingHappens) {
    lockAtStart();
    EXPECT_THAT(timer_.advance(kDue - 1), IsEmpty());
    EXPECT_FALSE(timer_.restricted());
}

TEST_F(RestrictedModeTimerTest, AtTheEndOfThePeriodRestrictedModeBegins) {
    lockAtStart();
    EXPECT_THAT(recordsOf(timer_.advance(kDue)),
                ElementsAre(timerRestarted(0, 1, kStart, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kDue))));
    EXPECT_TRUE(timer_.restricted());
}

TEST_F(RestrictedModeTimerTest, NoticedLateRestrictedModeStillBeganAtTheEndOfThePeriod) {
    lockAtStart();
    EXPECT_THAT(recordsOf(timer_.advance(kDue + 1)),
                ElementsAre(timerRestarted(0, 1, kStart, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kDue))));
    EXPECT_EQ(timer_.totalRestricted(kDue + 1), 1U);
}

TEST_F(RestrictedModeTimerTest, RestrictedModeBeginsOnce) {
    restrictAtDue();
    EXPECT_THAT(timer_.advance(kDue + 1), IsEmpty());
}

TEST(RestrictedModeTimerWithoutGraceTest, LockAloneBeginsRestrictedMode) {
    RestrictedModeTimer timer({.untilRestricted = 0, .analytics = kAnalyticsPeriod}, kStart);
    EXPECT_THAT(recordsOf(timer.lock(kStart)),
                ElementsAre(timerRestarted(0, 1, kStart, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kStart))));
    EXPECT_TRUE(timer.restricted());
    EXPECT_EQ(timer.nextDeadline(), kStart + kAnalyticsPeriod);
    EXPECT_THAT(recordsOf(timer.unlock(kStart)),
                ElementsAre(timerRestartedAnalytics(0), timerRestarted(0, 1, 0, 0),
                            saveAnalytics(figuresBlob(kStart, 0, 0, 0))));
}

TEST(RestrictedModeTimerWithoutGraceTest, OneSecondIsOneSecond) {
    RestrictedModeTimer timer({.untilRestricted = 1, .analytics = kAnalyticsPeriod}, kStart);
    EXPECT_THAT(recordsOf(timer.lock(kStart)),
                ElementsAre(timerRestarted(kStart + 1, 1, kStart, 0)));
    EXPECT_FALSE(timer.restricted());
    EXPECT_EQ(timer.advance(kStart + 1).size(), 2U);
    EXPECT_TRUE(timer.restricted());
}

TEST(RestrictedModeTimerWithoutGraceTest, PolicyDecidesBeforeTheLock) {
    RestrictedModeTimer timer({.untilRestricted = 0, .analytics = kAnalyticsPeriod}, kStart);
    RestrictedModePolicy off;
    off.allowed = false;
    EXPECT_THAT(timer.setPolicy(kStart, off), IsEmpty());
    EXPECT_THAT(recordsOf(timer.lock(kStart)), ElementsAre(timerRestarted(0, 1, kStart, 0)));
    EXPECT_FALSE(timer.restricted());
    EXPECT_EQ(timer.setPolicy(kStart + 1, {}).size(), 2U);
    EXPECT_TRUE(timer.restricted());
}

TEST_F(RestrictedModeTimerTest, UnlockInStandardModeCountsNothing) {
    lockAtStart();
    EXPECT_THAT(recordsOf(timer_.unlock(kDue - 1)),
                ElementsAre(timerRestartedAnalytics(0), timerRestarted(0, 1, 0, 0)));
}

TEST_F(RestrictedModeTimerTest, UnlockEndsRestrictedModeAndCountsIt) {
    restrictAtDue();
    EXPECT_THAT(recordsOf(timer_.unlock(kDue + 100)),
                ElementsAre(timerRestartedAnalytics(100), timerRestarted(0, 1, 0, 0),
                            saveAnalytics(figuresBlob(kStart, 100, 100, 0))));
    EXPECT_FALSE(timer_.restricted());
}

TEST_F(RestrictedModeTimerTest, UnlockAtTheVeryEndOfThePeriodComesAfterRestrictedModeBegan) {
    lockAtStart();
    EXPECT_THAT(recordsOf(timer_.unlock(kDue)),
                ElementsAre(timerRestarted(0, 1, kStart, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kDue)),
                            timerRestartedAnalytics(0), timerRestarted(0, 1, 0, 0),
                            saveAnalytics(figuresBlob(kStart, 0, 0, 0))));
}

TEST_F(RestrictedModeTimerTest, TotalStartsAnewWithTheTimerWhileThePeriodGoesOn) {
    restrictAtDue();
    static_cast<void>(timer_.unlock(kDue + 100));
    static_cast<void>(timer_.lock(kDue + 200));
    static_cast<void>(timer_.advance(kDue + 200 + kPeriod));
    EXPECT_THAT(recordsOf(timer_.unlock(kDue + 200 + kPeriod + 7)),
                ElementsAre(timerRestartedAnalytics(7), timerRestarted(0, 1, 0, 0),
                            saveAnalytics(figuresBlob(kStart, 107, 7, 0))));
}

TEST_F(RestrictedModeTimerTest, LockWhileNotAllowedWantsNoAlarm) {
    EXPECT_THAT(timer_.setPolicy(kStart, allowed(false)), IsEmpty());
    EXPECT_THAT(recordsOf(timer_.lock(kStart)), ElementsAre(timerRestarted(0, 1, kStart, 0)));
    EXPECT_THAT(timer_.advance(kDue + 1), IsEmpty());
}

TEST_F(RestrictedModeTimerTest, ForbiddingCancelsTheAlarm) {
    lockAtStart();
    EXPECT_THAT(recordsOf(timer_.setPolicy(kStart + 1, allowed(false))),
                ElementsAre(timerRestarted(0, 1, kStart, 0)));
}

TEST_F(RestrictedModeTimerTest, ForbiddingTwiceAnnouncesOnce) {
    lockAtStart();
    static_cast<void>(timer_.setPolicy(kStart + 1, allowed(false)));
    EXPECT_THAT(timer_.setPolicy(kStart + 2, allowed(false)), IsEmpty());
}

TEST_F(RestrictedModeTimerTest, ForbiddingEndsRestrictedMode) {
    restrictAtDue();
    EXPECT_THAT(recordsOf(timer_.setPolicy(kDue + 30, allowed(false))),
                ElementsAre(timerRestarted(0, 1, kStart, 0),
                            saveAnalytics(figuresBlob(kStart, 30, 30, 0))));
}

TEST_F(RestrictedModeTimerTest, AllowingBeforeThePeriodEndsWantsTheAlarmAgain) {
    lockAtStart();
    static_cast<void>(timer_.setPolicy(kStart + 1, allowed(false)));
    EXPECT_THAT(recordsOf(timer_.setPolicy(kDue - 1, allowed(true))),
                ElementsAre(timerRestarted(kDue, 1, kStart, 0)));
}

TEST_F(RestrictedModeTimerTest, AllowingAfterThePeriodEndedRestrictsAtOnce) {
    lockAtStart();
    static_cast<void>(timer_.setPolicy(kStart + 1, allowed(false)));
    EXPECT_THAT(recordsOf(timer_.setPolicy(kDue + 500, allowed(true))),
                ElementsAre(timerRestarted(0, 1, kStart, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kDue + 500))));
}

TEST_F(RestrictedModeTimerTest, StaysInterruptedByThePolicyAddUp) {
    restrictAtDue();
    static_cast<void>(timer_.setPolicy(kDue + 10, allowed(false)));
    static_cast<void>(timer_.setPolicy(kDue + 50, allowed(true)));
    EXPECT_EQ(recordsOf(timer_.unlock(kDue + 55)).front(), timerRestartedAnalytics(15));
}

TEST_F(RestrictedModeTimerTest, MissingPasscodeAndBootArgumentSwitchThePolicyOff) {
    lockAtStart();
    RestrictedModePolicy policy;
    policy.passcodeSet = false;
    EXPECT_THAT(recordsOf(timer_.setPolicy(kStart + 1, policy)),
                ElementsAre(timerRestarted(0, 1, kStart, 0)));
    policy.passcodeSet = true;
    policy.bootArg = true;
    EXPECT_THAT(timer_.setPolicy(kStart + 2, policy), IsEmpty());
    EXPECT_FALSE(timer_.policy().enabled());
}

TEST_F(RestrictedModeTimerTest, AnalyticsPeriodIsNotOverOneSecondEarly) {
    EXPECT_THAT(timer_.advance(kStart + kAnalyticsPeriod - 1), IsEmpty());
}

TEST_F(RestrictedModeTimerTest, AnalyticsPeriodEndsAndTheFiguresStartAnew) {
    constexpr std::uint64_t kEnd = kStart + kAnalyticsPeriod;
    restrictAtDue();
    static_cast<void>(timer_.unlock(kDue + 100));
    EXPECT_THAT(recordsOf(timer_.advance(kEnd)),
                ElementsAre(analyticsCollected(kAnalyticsPeriod, 100, 0),
                            saveAnalytics(figuresBlob(kEnd, 0, 100, 0))));
    EXPECT_THAT(recordsOf(timer_.advance(kEnd + kAnalyticsPeriod + 1)),
                ElementsAre(analyticsCollected(kAnalyticsPeriod, 0, 0),
                            saveAnalytics(figuresBlob(kEnd + kAnalyticsPeriod, 0, 100, 0))));
}

TEST_F(RestrictedModeTimerTest, StayAcrossAPeriodsEndIsSplitBetweenThePeriods) {
    constexpr std::uint64_t kEnd = kStart + kAnalyticsPeriod;
    restrictAtDue();
    EXPECT_EQ(recordsOf(timer_.advance(kEnd)).front(),
              analyticsCollected(kAnalyticsPeriod, kAnalyticsPeriod - kPeriod, 1));
    EXPECT_THAT(
        recordsOf(timer_.unlock(kEnd + 5)),
        ElementsAre(timerRestartedAnalytics(kAnalyticsPeriod - kPeriod + 5),
                    timerRestarted(0, 1, 0, 0),
                    saveAnalytics(figuresBlob(kEnd, 5, kAnalyticsPeriod - kPeriod + 5, 0))));
}

TEST_F(RestrictedModeTimerTest, CollectedFlagsTellWhatSwitchedThePolicyOff) {
    RestrictedModePolicy policy{.allowed = false, .passcodeSet = false, .bootArg = true};
    static_cast<void>(timer_.setPolicy(kStart, policy));
    EXPECT_EQ(recordsOf(timer_.advance(kStart + kAnalyticsPeriod)).front(),
              analyticsCollected(kAnalyticsPeriod, 0, 0, 1, 1, 1));
}

TEST_F(RestrictedModeTimerTest, LongStepDoesEverythingInTheOrderOfTime) {
    constexpr std::uint64_t kEnd = kStart + kAnalyticsPeriod;
    static_cast<void>(timer_.lock(kEnd - 10));
    const auto records = recordsOf(timer_.advance(kEnd + 2 * kAnalyticsPeriod));
    ASSERT_EQ(records.size(), 8U);
    EXPECT_EQ(records[0], analyticsCollected(kAnalyticsPeriod, 0, 0));
    EXPECT_EQ(records[2], timerRestarted(0, 1, kEnd - 10, 1));
    EXPECT_EQ(records[4], analyticsCollected(kAnalyticsPeriod, kAnalyticsPeriod - kPeriod + 10, 1));
    EXPECT_EQ(records[6], analyticsCollected(kAnalyticsPeriod, kAnalyticsPeriod, 1));
}

TEST_F(RestrictedModeTimerTest, PeriodsAreCollectedOneByOneUpToTheLimit) {
    constexpr auto kLimit = RestrictedModeTimer::kMaxPeriodsAtOnce;
    EXPECT_EQ(timer_.advance(kStart + kLimit * kAnalyticsPeriod).size(), 2 * kLimit);
}

TEST_F(RestrictedModeTimerTest, MorePeriodsThanTheLimitAreCollectedAsOne) {
    constexpr auto kLimit = RestrictedModeTimer::kMaxPeriodsAtOnce;
    constexpr std::uint64_t kEnd = kStart + (kLimit + 1) * kAnalyticsPeriod;
    EXPECT_THAT(recordsOf(timer_.advance(kEnd)),
                ElementsAre(analyticsCollected((kLimit + 1) * kAnalyticsPeriod, 0, 0),
                            saveAnalytics(figuresBlob(kEnd, 0, 0, 0))));
}

TEST_F(RestrictedModeTimerTest, LeapOverManyPeriodsStopsWhereRestrictedModeBegins) {
    constexpr std::uint64_t kNow = kStart + std::uint64_t{5000} * kAnalyticsPeriod;
    constexpr std::uint64_t kLock = kStart + kAnalyticsPeriod - 1;
    static_cast<void>(timer_.lock(kLock));
    const auto records = recordsOf(timer_.advance(kNow));
    ASSERT_EQ(records.size(), 6U);
    EXPECT_EQ(records[0], analyticsCollected(kAnalyticsPeriod - 1 + kPeriod, 0, 0));
    EXPECT_EQ(records[2], timerRestarted(0, 1, kLock, 1));
    EXPECT_EQ(records[4].size(), 36U);
    EXPECT_EQ(timer_.figures().periodStart, kNow);
}

TEST_F(RestrictedModeTimerTest, DurationsBeyond32BitsAreHeldAtTheirEnd) {
    restrictAtDue();
    const auto records = recordsOf(timer_.advance(RestrictedModeTimer::kLatestTime));
    EXPECT_EQ(records.front(), analyticsCollected(0xffffffff, 0xffffffff, 1));
    EXPECT_EQ(timer_.totalRestricted(RestrictedModeTimer::kLatestTime), 0xffffffffU);
}

TEST_F(RestrictedModeTimerTest, TimeThatGoesBackFiresNothingAndCountsNothing) {
    restrictAtDue();
    EXPECT_THAT(timer_.advance(kStart - 500), IsEmpty());
    EXPECT_EQ(recordsOf(timer_.unlock(kStart - 500)).front(), timerRestartedAnalytics(0));
}

TEST_F(RestrictedModeTimerTest, RestoredRunningTimerIsAnnouncedAgain) {
    const TimerState state{
        .version = 7, .standardModeStart = kStart - 600, .lockedInRestrictedMode = 0};
    EXPECT_THAT(recordsOf(timer_.restoreState(kStart, true, state)),
                ElementsAre(timerRestarted(kDue - 600, 7, kStart - 600, 0)));
    EXPECT_TRUE(timer_.locked());
}

TEST_F(RestrictedModeTimerTest, RestoredTimerOneSecondBeforeItsEndStillRuns) {
    const TimerState state{
        .version = 1, .standardModeStart = kStart - kPeriod + 1, .lockedInRestrictedMode = 0};
    EXPECT_THAT(recordsOf(timer_.restoreState(kStart, true, state)),
                ElementsAre(timerRestarted(kStart + 1, 1, kStart - kPeriod + 1, 0)));
}

TEST_F(RestrictedModeTimerTest, RestoredTimerThatIsDueRestrictsAtOnce) {
    const TimerState state{
        .version = 1, .standardModeStart = kStart - kPeriod, .lockedInRestrictedMode = 0};
    EXPECT_THAT(recordsOf(timer_.restoreState(kStart, true, state)),
                ElementsAre(timerRestarted(0, 1, kStart - kPeriod, 1),
                            saveAnalytics(figuresBlob(kStart, 0, 0, kStart))));
}

TEST_F(RestrictedModeTimerTest, RestoredTimerThatIsDueButNotAllowedChangesNothing) {
    const TimerState state{
        .version = 1, .standardModeStart = kStart - kPeriod, .lockedInRestrictedMode = 0};
    EXPECT_THAT(timer_.restoreState(kStart, false, state), IsEmpty());
    EXPECT_TRUE(timer_.locked());
    EXPECT_FALSE(timer_.restricted());
}

TEST_F(RestrictedModeTimerTest, RestoredRestrictedStateGoesOn) {
    const TimerState state{
        .version = 1, .standardModeStart = kStart - 9, .lockedInRestrictedMode = 0xff};
    EXPECT_THAT(timer_.restoreState(kStart, true, state), IsEmpty());
    EXPECT_TRUE(timer_.restricted());
    EXPECT_EQ(recordsOf(timer_.unlock(kStart + 3)).front(), timerRestartedAnalytics(3));
}

TEST_F(RestrictedModeTimerTest, RestoredRestrictedStateEndsWhenItIsNotAllowed) {
    const TimerState state{
        .version = 1, .standardModeStart = kStart - 9, .lockedInRestrictedMode = 1};
    EXPECT_THAT(recordsOf(timer_.restoreState(kStart, false, state)),
                ElementsAre(timerRestarted(0, 1, kStart - 9, 0),
                            saveAnalytics(figuresBlob(kStart, 0, 0, 0))));
}

TEST_F(RestrictedModeTimerTest, RestoredStartAtTheEndOfTimeNeverBecomesDue) {
    const TimerState state{
        .version = 1, .standardModeStart = ~std::uint64_t{0}, .lockedInRestrictedMode = 0};
    EXPECT_THAT(recordsOf(timer_.restoreState(kStart, true, state)),
                ElementsAre(timerRestarted(~std::uint64_t{0}, 1, ~std::uint64_t{0}, 0)));
    static_cast<void>(timer_.advance(RestrictedModeTimer::kLatestTime));
    EXPECT_FALSE(timer_.restricted());
}

TEST_F(RestrictedModeTimerTest, RestoredFiguresGoOn) {
    const auto blob = arrayOf<32>(figuresBlob(kStart - 400, 11, 22, 0));
    EXPECT_THAT(timer_.restoreAnalytics(kStart, blob), IsEmpty());
    EXPECT_EQ(encodeFigures(timer_.figures()), blob);
    EXPECT_EQ(timer_.nextDeadline(), kStart - 400 + kAnalyticsPeriod);
}

TEST_F(RestrictedModeTimerTest, RestoredPeriodThatIsOverIsCollectedAtOnce) {
    const auto blob = arrayOf<32>(figuresBlob(kStart - kAnalyticsPeriod, 11, 22, 0));
    EXPECT_THAT(recordsOf(timer_.restoreAnalytics(kStart, blob)),
                ElementsAre(analyticsCollected(kAnalyticsPeriod, 11, 0),
                            saveAnalytics(figuresBlob(kStart, 0, 22, 0))));
}

TEST_F(RestrictedModeTimerTest, UnfinishedStayGoesOnWithTheRestrictedState) {
    static_cast<void>(timer_.restoreAnalytics(
        kStart, arrayOf<32>(figuresBlob(kStart - 400, 11, 22, kStart - 50))));
    const TimerState state{
        .version = 1, .standardModeStart = kStart - 9000, .lockedInRestrictedMode = 1};
    static_cast<void>(timer_.restoreState(kStart, true, state));
    EXPECT_EQ(recordsOf(timer_.unlock(kStart + 1)).front(), timerRestartedAnalytics(22 + 51));
}

TEST_F(RestrictedModeTimerTest, UnfinishedStayIsForgottenWithoutARestrictedState) {
    static_cast<void>(timer_.restoreAnalytics(
        kStart, arrayOf<32>(figuresBlob(kStart - 400, 11, 22, kStart - 50))));
    static_cast<void>(timer_.restoreState(kStart, true, TimerState{.version = 1}));
    EXPECT_FALSE(timer_.restricted());
    EXPECT_EQ(timer_.totalRestricted(kStart + 1), 22U);
}

TEST_F(RestrictedModeTimerTest, FiguresThatCannotBeTrueAreLeftAlone) {
    const AnalyticsFigures before = timer_.figures();
    const std::vector<ByteVector> blobs = {
        figuresBlob(kStart + 1, 1, 2, 0), figuresBlob(kStart, 1, 2, kStart + 1),
        figuresBlob(0, 1, 2, 0), Bytes().fill(32, 0xff).get(), Bytes().fill(32, 0).get(),
        // Of another version, and with something where nothing is to be.
        Bytes().u64(kStart - 400).u32(1).u32(2).u64(0).u32(2).u32(0).get(),
        Bytes().u64(kStart - 400).u32(1).u32(2).u64(0).u32(1).u32(1).get()};
    for (const ByteVector& blob : blobs) {
        EXPECT_THAT(timer_.restoreAnalytics(kStart, arrayOf<32>(blob)), IsEmpty());
        EXPECT_EQ(timer_.figures(), before);
    }
}

} // namespace

} // namespace keystrand::test
