#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

namespace kstd {
namespace {

constexpr std::int64_t kWeek = 604'800;
/// A multiple of 64, which a 32-bit float holds exactly.
constexpr std::int64_t kStart = 721'692'800;

class VacuumTest : public DatabaseFixture {
  protected:
    [[nodiscard]] Texts lastVacuum() {
        return OtherConnection(path).rows("select value from Properties where key = 'LastVacuum'");
    }
    [[nodiscard]] std::string autoVacuum() {
        return OtherConnection(path).one("pragma auto_vacuum");
    }
    void openAt(std::int64_t secondsSince2001) {
        setSecondsSince2001(secondsSince2001);
        openDatabase()->close();
    }
};

TEST_F(VacuumTest, FirstOpeningVacuumsUnlessTheClockStandsInTheFirstWeek) {
    openAt(0);
    openAt(kWeek);
    EXPECT_EQ(lastVacuum(), Texts());
    EXPECT_EQ(autoVacuum(), "0");
    openAt(kWeek + 1);
    EXPECT_EQ(lastVacuum(), Texts{"604801.000000"});
    EXPECT_EQ(autoVacuum(), "1");
}

TEST_F(VacuumTest, ClockBefore2001DoesNotVacuum) {
    openAt(-1);
    EXPECT_EQ(lastVacuum(), Texts());
}

TEST_F(VacuumTest, NextVacuumIsMoreThanAWeekLater) {
    openAt(kStart);
    openAt(kStart + kWeek - 1);
    openAt(kStart + kWeek);
    EXPECT_EQ(lastVacuum(), Texts{"721692800.000000"});
    openAt(kStart + kWeek + 1);
    EXPECT_EQ(lastVacuum(), Texts{"722297601.000000"});
}

TEST_F(VacuumTest, StoredTimeIsReadToAMultipleOf64Seconds) {
    openAt(kStart + 32 + 1);
    // Read as kStart + 64.
    openAt(kStart + 64 + kWeek);
    EXPECT_EQ(lastVacuum(), Texts{"721692833.000000"});
    openAt(kStart + 64 + kWeek + 1);
    EXPECT_EQ(lastVacuum(), Texts{"722297665.000000"});
}

TEST_F(VacuumTest, StoredTextThatIsNoNumberVacuums) {
    openAt(kStart);
    ASSERT_EQ(
        OtherConnection(path).run("update Properties set value = 'soon' where key = 'LastVacuum'"),
        SQLITE_OK);
    openAt(kStart);
    EXPECT_EQ(lastVacuum(), Texts{"721692800.000000"});
}

TEST_F(VacuumTest, AutomaticVacuumStaysOnWithoutPeriodicOnes) {
    openAt(kStart);
    const auto opened = openDatabase();
    opened->close();
    opened->setShouldVacuum(false);
    ASSERT_TRUE(opened->openWithError(nullptr));
    EXPECT_EQ(autoVacuum(), "1");
}

TEST_F(VacuumTest, AutomaticVacuumStaysOffWithoutAPeriodicOne) {
    const auto made = database();
    made->setShouldVacuum(false);
    for (int i = 0; i < 2; ++i) {
        ASSERT_TRUE(made->openWithError(nullptr));
        made->close();
    }
    EXPECT_EQ(lastVacuum(), Texts());
    EXPECT_EQ(autoVacuum(), "0");
}

TEST_F(VacuumTest, VacuumShrinksTheFile) {
    openAt(kStart);
    {
        OtherConnection other(path);
        // A file without automatic vacuum, most of which is free.
        ASSERT_EQ(other.run("pragma journal_mode = delete; pragma auto_vacuum = none; vacuum;"
                            "insert into T values (zeroblob(1000000), 0); delete from T"),
                  SQLITE_OK);
    }
    EXPECT_GT(std::filesystem::file_size(path), 1'000'000U);
    openAt(kStart + kWeek + 1);
    EXPECT_LT(std::filesystem::file_size(path), 100'000U);
}

} // namespace
} // namespace kstd
