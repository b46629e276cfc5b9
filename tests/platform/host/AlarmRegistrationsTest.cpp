#include "platform/host/AlarmRegistrations.h"

#include <gmock/gmock.h>

namespace platform {
namespace {

using testing::ElementsAre;
using Name = AlarmRegistrations::Name;

class AlarmRegistrationsTest : public testing::Test {
  protected:
    const Name a{"stream", "a"};
    const Name b{"stream", "b"};
    AlarmRegistrations registrations;
};

TEST_F(AlarmRegistrationsTest, NothingIsDueAtFirst) {
    EXPECT_THAT(registrations.takeDue(kDistantFuture), ElementsAre());
    EXPECT_EQ(registrations.next(), std::nullopt);
}

TEST_F(AlarmRegistrationsTest, AlarmIsDueAtItsDateAndNotBefore) {
    registrations.put(a, {10});
    EXPECT_THAT(registrations.takeDue({9}), ElementsAre());
    EXPECT_THAT(registrations.takeDue({10}), ElementsAre(a));
}

TEST_F(AlarmRegistrationsTest, AlarmsAreTakenOnceAndInTheOrderOfTheirDates) {
    registrations.put(a, {20});
    registrations.put(b, {10});
    EXPECT_THAT(registrations.takeDue({30}), ElementsAre(b, a));
    EXPECT_THAT(registrations.takeDue({30}), ElementsAre());
}

TEST_F(AlarmRegistrationsTest, NextIsTheEarliestThatHasNotFired) {
    registrations.put(a, {20});
    registrations.put(b, {10});
    EXPECT_EQ(registrations.next(), Date{10});
    EXPECT_THAT(registrations.takeDue({10}), ElementsAre(b));
    EXPECT_EQ(registrations.next(), Date{20});
}

TEST_F(AlarmRegistrationsTest, PuttingAnewReplacesAndFiresAgain) {
    registrations.put(a, {10});
    EXPECT_THAT(registrations.takeDue({10}), ElementsAre(a));
    EXPECT_TRUE(registrations.hasFired(a));
    registrations.put(a, {20});
    EXPECT_FALSE(registrations.hasFired(a));
    EXPECT_EQ(registrations.next(), Date{20});
}

TEST_F(AlarmRegistrationsTest, PutIfAbsentLeavesWhatIsThere) {
    registrations.put(a, {10});
    registrations.putIfAbsent(a, {20});
    registrations.putIfAbsent(b, {30});
    EXPECT_EQ(registrations.next(), Date{10});
    EXPECT_THAT(registrations.takeDue({30}), ElementsAre(a, b));
}

TEST_F(AlarmRegistrationsTest, ErasedAlarmIsGone) {
    registrations.put(a, {10});
    registrations.erase(a);
    registrations.erase(b);
    EXPECT_EQ(registrations.next(), std::nullopt);
    EXPECT_FALSE(registrations.hasFired(a));
}

TEST_F(AlarmRegistrationsTest, OneIsTakenOnlyForItsVeryDateAndOnce) {
    registrations.put(a, {10});
    EXPECT_FALSE(registrations.take(a, {9}));
    EXPECT_FALSE(registrations.take(b, {10}));
    EXPECT_TRUE(registrations.take(a, {10}));
    EXPECT_FALSE(registrations.take(a, {10}));
    EXPECT_TRUE(registrations.hasFired(a));
}

} // namespace
} // namespace platform
