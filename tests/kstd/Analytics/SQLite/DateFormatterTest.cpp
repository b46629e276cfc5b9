#include "kstd/Analytics/SQLite/DateFormatter.h"

#include <gtest/gtest.h>

#include <limits>

namespace kstd {
namespace {

using platform::Timestamp;

constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr double kFirst = -63113904000; // 0001-01-01T00:00:00Z
constexpr double kLast = 252423993599;  // 9999-12-31T23:59:59Z
constexpr double kDay = 86400;

struct Writing {
    double seconds;
    std::string_view text;
};

TEST(DateFormatter, WritesWholeSecondsInUTC) {
    const Writing writings[] = {
        {0, "2001-01-01T00:00:00Z"},          {-1, "2000-12-31T23:59:59Z"},
        {-978307200, "1970-01-01T00:00:00Z"}, {59, "2001-01-01T00:00:59Z"},
        {3599, "2001-01-01T00:59:59Z"},       {kDay - 1, "2001-01-01T23:59:59Z"},
        {721692800, "2023-11-14T22:13:20Z"},  {730857599, "2024-02-28T23:59:59Z"},
        {730857600, "2024-02-29T00:00:00Z"},  {-26524800, "2000-02-29T00:00:00Z"},
    };
    for (const Writing& writing : writings) {
        EXPECT_EQ(DateFormatter().text(Timestamp{writing.seconds}), writing.text);
    }
}

TEST(DateFormatter, FractionsAreCutOffTowardsThePast) {
    EXPECT_EQ(DateFormatter().text(Timestamp{0.999}), "2001-01-01T00:00:00Z");
    EXPECT_EQ(DateFormatter().text(Timestamp{-0.001}), "2000-12-31T23:59:59Z");
    EXPECT_EQ(DateFormatter().text(Timestamp{-1.0}), "2000-12-31T23:59:59Z");
    EXPECT_EQ(DateFormatter().text(Timestamp{-0.0}), "2001-01-01T00:00:00Z");
}

TEST(DateFormatter, YearsAreHeldWithinFourDigits) {
    const Writing writings[] = {
        {kFirst, "0001-01-01T00:00:00Z"},
        {kFirst - 0.5, "0001-01-01T00:00:00Z"},
        {kFirst - 1, "0001-01-01T00:00:00Z"},
        {kFirst + 1, "0001-01-01T00:00:01Z"},
        {kLast - 1, "9999-12-31T23:59:58Z"},
        {kLast, "9999-12-31T23:59:59Z"},
        {kLast + 0.5, "9999-12-31T23:59:59Z"},
        {kLast + 1, "9999-12-31T23:59:59Z"},
        {1e300, "9999-12-31T23:59:59Z"},
        {-1e300, "0001-01-01T00:00:00Z"},
        {kInfinity, "9999-12-31T23:59:59Z"},
        {-kInfinity, "0001-01-01T00:00:00Z"},
        {std::numeric_limits<double>::quiet_NaN(), "2001-01-01T00:00:00Z"},
    };
    for (const Writing& writing : writings) {
        EXPECT_EQ(DateFormatter().text(Timestamp{writing.seconds}), writing.text);
    }
}

TEST(DateFormatter, ReadsUTCAndOffsets) {
    const Writing readings[] = {
        {0, "2001-01-01T00:00:00Z"},          {0, "2001-01-01T00:00:00+00:00"},
        {0, "2001-01-01T00:00:00-00:00"},     {0, "2001-01-01T02:00:00+02:00"},
        {0, "2000-12-31T18:30:00-05:30"},     {-86340, "2001-01-01T00:00:00+23:59"},
        {86340, "2001-01-01T00:00:00-23:59"}, {721692800, "2023-11-14T22:13:20Z"},
        {730857600, "2024-02-29T00:00:00Z"},  {-26524800, "2000-02-29T00:00:00Z"},
        {kFirst, "0001-01-01T00:00:00Z"},     {kFirst - 3600, "0001-01-01T00:00:00+01:00"},
        {kLast, "9999-12-31T23:59:59Z"},      {kLast + 3600, "9999-12-31T23:59:59-01:00"},
    };
    for (const Writing& reading : readings) {
        SCOPED_TRACE(reading.text);
        EXPECT_EQ(DateFormatter().date(reading.text), Timestamp{reading.seconds});
    }
}

TEST(DateFormatter, NeighboursOfTheDigitsAreNone) {
    const std::string text = "2001-01-01T01:01:01+01:01";
    ASSERT_TRUE(DateFormatter().date(text).has_value());
    for (std::size_t at = 0; at < text.size(); ++at) {
        for (const char neighbour : {'/', ':'}) {
            std::string changed = text;
            changed[at] = neighbour;
            EXPECT_EQ(DateFormatter().date(changed).has_value(), changed == text) << changed;
        }
    }
}

TEST(DateFormatter, EverythingElseIsNoDate) {
    const std::string_view texts[] = {
        "",
        "2001-01-01",
        "2001-01-01T00:00:00",
        "2001-01-01T00:00Z",
        "2001-01-01T00:00:00z",
        "2001-01-01t00:00:00Z",
        "2001-01-01 00:00:00Z",
        "2001-01-01T00:00:00 Z",
        "2001-01-01T00:00:00ZZ",
        " 2001-01-01T00:00:00Z",
        "2001-01-01T00:00:00Z ",
        "2001-01-01T00:00:00Z\n",
        "2001-01-01T00:00:00.5Z",
        "2001-01-01T00:00:00,5Z",
        "2001-01-01T00:00:00+0200",
        "2001-01-01T00:00:00+02",
        "2001-01-01T00:00:00+2:00",
        "2001-01-01T00:00:00+02:0",
        "2001-01-01T00:00:00+02:00:00",
        "2001-01-01T00:00:00+24:00",
        "2001-01-01T00:00:00-24:00",
        "2001-01-01T00:00:00+00:60",
        "2001-01-01T00:00:00GMT",
        "2001-1-1T00:00:00Z",
        "201-01-01T00:00:00Z",
        "12001-01-01T00:00:00Z",
        "-001-01-01T00:00:00Z",
        "+2001-01-01T00:00:00Z",
        "0000-12-31T23:59:59Z",
        "2001-00-01T00:00:00Z",
        "2001-13-01T00:00:00Z",
        "2001-01-00T00:00:00Z",
        "2001-01-32T00:00:00Z",
        "2001-04-31T00:00:00Z",
        "2023-02-29T00:00:00Z",
        "1900-02-29T00:00:00Z",
        "2001-01-01T24:00:00Z",
        "2001-01-01T00:60:00Z",
        "2001-01-01T00:00:60Z",
        "2001-01-0aT00:00:00Z",
        "2001-01-01T00:0 :00Z",
        "2001/01/01T00:00:00Z",
        "700000000.000000",
    };
    for (const std::string_view text : texts) {
        SCOPED_TRACE(text);
        EXPECT_FALSE(DateFormatter().date(text).has_value());
    }
}

TEST(DateFormatter, EveryDayOfFourCenturiesComesBack) {
    double expected = -12622780800; // 1601-01-01
    for (int day = 0; day < 146097; ++day, expected += kDay) {
        const std::optional<Timestamp> date =
            DateFormatter().date(DateFormatter().text(Timestamp{expected}));
        ASSERT_EQ(date, Timestamp{expected});
    }
}

} // namespace
} // namespace kstd
