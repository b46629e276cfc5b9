#include "keystrand/Registry.h"

#include "tests/keystrand/Bytes.h"

#include <gtest/gtest.h>

#include <string>

namespace keystrand::test {

namespace {

const std::vector<std::uint8_t> kFirst = {1};
const std::vector<std::uint8_t> kSecond = {2, 2};

class RegistryTest : public testing::Test {
  protected:
    Registry registry_;
};

TEST_F(RegistryTest, AbsentAndEmptyAreDifferent) {
    EXPECT_FALSE(registry_.copy("P"));
    ASSERT_TRUE(registry_.set("P", {}));
    ASSERT_TRUE(registry_.copy("P"));
    EXPECT_TRUE(registry_.copy("P")->empty());
}

TEST_F(RegistryTest, AcknowledgedRecordThatWasReadIsDropped) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    EXPECT_EQ(registry_.copy("P"), kFirst);
    EXPECT_TRUE(registry_.acknowledge("P"));
    EXPECT_EQ(registry_.find("P"), nullptr);
}

TEST_F(RegistryTest, RecordThatNobodyReadSurvivesAnAcknowledgement) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    EXPECT_FALSE(registry_.acknowledge("P"));
    EXPECT_NE(registry_.find("P"), nullptr);
}

TEST_F(RegistryTest, NewerRecordSurvivesTheAcknowledgementOfTheOlder) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    static_cast<void>(registry_.copy("P"));
    ASSERT_TRUE(registry_.set("P", kSecond));
    EXPECT_FALSE(registry_.acknowledge("P"));
    EXPECT_EQ(registry_.copy("P"), kSecond);
    EXPECT_TRUE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, SameBytesPublishedAgainAreANewerRecord) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    static_cast<void>(registry_.copy("P"));
    ASSERT_TRUE(registry_.set("P", kFirst));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, RecordPublishedAfterRemovalIsNotTheOneHandedOut) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    static_cast<void>(registry_.copy("P"));
    ASSERT_TRUE(registry_.remove("P"));
    ASSERT_TRUE(registry_.set("P", kSecond));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, RecordThatWasAnnouncedTwiceStaysUntilBothEventsAreAnswered) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    registry_.announce("P");
    ASSERT_TRUE(registry_.set("P", kSecond));
    registry_.announce("P");
    EXPECT_EQ(registry_.copy("P"), kSecond);
    EXPECT_FALSE(registry_.acknowledge("P"));
    EXPECT_EQ(registry_.copy("P"), kSecond);
    EXPECT_TRUE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, NewerRecordThatWasAnnouncedSurvivesTheAcknowledgementOfTheOlder) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    registry_.announce("P");
    static_cast<void>(registry_.copy("P"));
    ASSERT_TRUE(registry_.set("P", kSecond));
    registry_.announce("P");
    EXPECT_FALSE(registry_.acknowledge("P"));
    EXPECT_EQ(registry_.copy("P"), kSecond);
    EXPECT_TRUE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, RecordThatWasReadAndNotAcknowledgedLeavesNoAnnouncementBehind) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    registry_.announce("P");
    static_cast<void>(registry_.copy("P"));
    ASSERT_TRUE(registry_.set("P", kSecond));
    registry_.announce("P");
    static_cast<void>(registry_.copy("P"));
    EXPECT_TRUE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, AnnouncementsThatAreForgottenNeedNoAnswer) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    registry_.announce("P");
    ASSERT_TRUE(registry_.set("P", kSecond));
    registry_.announce("P");
    ASSERT_TRUE(registry_.forgetAnnouncements({"P", registry_.find("P")->generation}));
    EXPECT_FALSE(registry_.acknowledge("P"));
    EXPECT_EQ(registry_.copy("P"), kSecond);
    EXPECT_TRUE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, AnnouncementsOfANewerRecordAreNotForgotten) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    const std::uint64_t former = registry_.find("P")->generation;
    ASSERT_TRUE(registry_.set("P", kSecond));
    registry_.announce("P");
    registry_.announce("P");
    EXPECT_FALSE(registry_.forgetAnnouncements({"P", former}));
    EXPECT_FALSE(registry_.forgetAnnouncements({"Q", former}));
    static_cast<void>(registry_.copy("P"));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, RecordsComeInTheOrderInWhichTheyWereSet) {
    EXPECT_TRUE(registry_.records().empty());
    for (const char* const name : {"B", "A", "C", "B"}) {
        ASSERT_TRUE(registry_.set(name, kFirst));
    }
    std::string order;
    for (const Registry::Record& record : registry_.records()) {
        order += record.name;
        EXPECT_EQ(record.generation, registry_.find(record.name)->generation);
    }
    EXPECT_EQ(order, "ACB");
}

TEST_F(RegistryTest, AnnouncingWhatIsNotThereDoesNothing) {
    registry_.announce("P");
    EXPECT_EQ(registry_.count(), 0U);
}

TEST_F(RegistryTest, SecondAcknowledgementDropsNothing) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    static_cast<void>(registry_.copy("P"));
    EXPECT_TRUE(registry_.acknowledge("P"));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, UnknownNameIsNeitherRemovedNorAcknowledged) {
    EXPECT_FALSE(registry_.remove("P"));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, LookingWithoutCopyingHandsNothingOut) {
    ASSERT_TRUE(registry_.set("P", kFirst));
    static_cast<void>(registry_.find("P"));
    EXPECT_FALSE(registry_.acknowledge("P"));
}

TEST_F(RegistryTest, NameCutAt64BytesStandsForTheLongerProperty) {
    const std::string name(70, 'n');
    ASSERT_TRUE(registry_.set(name, kFirst));
    static_cast<void>(registry_.copy(name));
    EXPECT_FALSE(registry_.acknowledge(name.substr(0, 63)));
    EXPECT_TRUE(registry_.acknowledge(name.substr(0, 64)));
}

TEST_F(RegistryTest, CutNameStandsForThePropertyReadLast) {
    const std::string stem(64, 'n');
    ASSERT_TRUE(registry_.set(stem + "a", kFirst));
    ASSERT_TRUE(registry_.set(stem + "b", kFirst));
    ASSERT_TRUE(registry_.set(stem + "c", kFirst));
    static_cast<void>(registry_.copy(stem + "b"));
    EXPECT_TRUE(registry_.acknowledge(stem));
    EXPECT_EQ(registry_.find(stem + "b"), nullptr);
    EXPECT_EQ(registry_.count(), 2U);
}

TEST_F(RegistryTest, CutNameStandsForTheLastCopyAlsoOfAnOlderRecord) {
    const std::string stem(64, 'n');
    ASSERT_TRUE(registry_.set(stem + "a", kFirst));
    ASSERT_TRUE(registry_.set(stem + "b", kFirst));
    static_cast<void>(registry_.copy(stem + "b"));
    static_cast<void>(registry_.copy(stem + "a"));
    EXPECT_TRUE(registry_.acknowledge(stem));
    EXPECT_EQ(registry_.find(stem + "a"), nullptr);
    EXPECT_NE(registry_.find(stem + "b"), nullptr);
}

TEST_F(RegistryTest, NameLengthHasLimits) {
    EXPECT_FALSE(registry_.set("", kFirst));
    EXPECT_TRUE(registry_.set(std::string(254, 'n'), kFirst));
    EXPECT_TRUE(registry_.set(std::string(255, 'n'), kFirst));
    EXPECT_FALSE(registry_.set(std::string(256, 'n'), kFirst));
}

TEST_F(RegistryTest, ValueSizeHasALimit) {
    EXPECT_TRUE(registry_.set("P", std::vector<std::uint8_t>(Registry::kMaxValueSize - 1)));
    EXPECT_TRUE(registry_.set("P", std::vector<std::uint8_t>(Registry::kMaxValueSize)));
    EXPECT_FALSE(registry_.set("P", std::vector<std::uint8_t>(Registry::kMaxValueSize + 1)));
    EXPECT_EQ(registry_.find("P")->value.size(), Registry::kMaxValueSize);
}

TEST_F(RegistryTest, PropertyCountHasALimit) {
    for (std::size_t i = 0; i < Registry::kMaxProperties; ++i) {
        EXPECT_TRUE(registry_.set("P" + std::to_string(i), kFirst));
    }
    EXPECT_FALSE(registry_.set("one more", kFirst));
    EXPECT_TRUE(registry_.set("P0", kSecond));
}

} // namespace

} // namespace keystrand::test
