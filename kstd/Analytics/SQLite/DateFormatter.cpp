#include "kstd/Analytics/SQLite/DateFormatter.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <cstdint>

namespace kstd {

namespace {

using std::chrono::sys_days;
using std::chrono::sys_seconds;

constexpr int kFirstYear = 1;
constexpr int kLastYear = 9999;

constexpr std::size_t kYear = 0;
constexpr std::size_t kMonth = 5;
constexpr std::size_t kDay = 8;
constexpr std::size_t kHour = 11;
constexpr std::size_t kMinute = 14;
constexpr std::size_t kSecond = 17;
constexpr std::size_t kZone = 19;
constexpr std::size_t kZoneHour = 20;
constexpr std::size_t kZoneMinute = 23;

constexpr double timestampOf(sys_seconds moment) {
    return static_cast<double>(moment.time_since_epoch().count() -
                               platform::kSecondsFrom1970To2001);
}

constexpr sys_seconds kFirst = sys_days(std::chrono::year(kFirstYear) / 1 / 1);
constexpr sys_seconds kLast = sys_days(std::chrono::year(kLastYear) / 12 / 31) +
                              std::chrono::days(1) - std::chrono::seconds(1);

sys_seconds heldMoment(platform::Timestamp date) {
    const double seconds = std::isnan(date.secondsSince2001) ? 0 : date.secondsSince2001;
    // Held before it becomes an integer: a double may be beyond all of them.
    const double held = std::clamp(std::floor(seconds), timestampOf(kFirst), timestampOf(kLast));
    return sys_seconds(
        std::chrono::seconds(static_cast<std::int64_t>(held) + platform::kSecondsFrom1970To2001));
}

/// Writes over the `count` characters at `at`.
void putNumber(std::string& text, std::size_t at, std::size_t count, std::int64_t number) {
    for (std::size_t i = count; i-- > 0; number /= 10) {
        text[at + i] = static_cast<char>('0' + number % 10);
    }
}

/// The number in the `count` digits at `at`.
unsigned numberIn(std::string_view text, std::size_t at, std::size_t count = 2) {
    unsigned number = 0;
    for (const char digit : text.substr(at, count)) {
        number = number * 10 + static_cast<unsigned>(digit - '0');
    }
    return number;
}

/// In `form` a 0 stands for any digit, and everything else for itself.
bool hasForm(std::string_view text, std::string_view form) {
    return std::equal(text.begin(), text.end(), form.begin(), form.end(), [](char is, char shall) {
        return shall == '0' ? is >= '0' && is <= '9' : is == shall;
    });
}

/// How far the zone at the end of the text is ahead of UTC.
std::optional<std::chrono::minutes> zoneOffset(std::string_view text) {
    const std::string_view zone = text.substr(kZone);
    if (zone == "Z") {
        return std::chrono::minutes(0);
    }
    const unsigned hours = numberIn(text, kZoneHour);
    const unsigned minutes = numberIn(text, kZoneMinute);
    if (hours > 23 || minutes > 59) {
        return std::nullopt;
    }
    const std::chrono::minutes offset = std::chrono::hours(hours) + std::chrono::minutes(minutes);
    return zone.front() == '-' ? -offset : offset;
}

} // namespace

std::string DateFormatter::text(platform::Timestamp date) const {
    const sys_seconds moment = heldMoment(date);
    const sys_days midnight = std::chrono::floor<std::chrono::days>(moment);
    const std::chrono::year_month_day day(midnight);
    const std::chrono::hh_mm_ss time(moment - midnight);
    std::string text = "0000-00-00T00:00:00Z";
    putNumber(text, kYear, 4, static_cast<int>(day.year()));
    putNumber(text, kMonth, 2, static_cast<unsigned>(day.month()));
    putNumber(text, kDay, 2, static_cast<unsigned>(day.day()));
    putNumber(text, kHour, 2, time.hours().count());
    putNumber(text, kMinute, 2, time.minutes().count());
    putNumber(text, kSecond, 2, time.seconds().count());
    return text;
}

std::optional<platform::Timestamp> DateFormatter::date(std::string_view text) const {
    if (!hasForm(text, "0000-00-00T00:00:00Z") && !hasForm(text, "0000-00-00T00:00:00+00:00") &&
        !hasForm(text, "0000-00-00T00:00:00-00:00")) {
        return std::nullopt;
    }
    const std::chrono::year year(static_cast<int>(numberIn(text, kYear, 4)));
    const std::chrono::year_month_day day(year, std::chrono::month(numberIn(text, kMonth)),
                                          std::chrono::day(numberIn(text, kDay)));
    const unsigned hour = numberIn(text, kHour);
    const unsigned minute = numberIn(text, kMinute);
    const unsigned second = numberIn(text, kSecond);
    const std::optional<std::chrono::minutes> offset = zoneOffset(text);
    if (static_cast<int>(year) < kFirstYear || !day.ok() || hour > 23 || minute > 59 ||
        second > 59 || !offset) {
        return std::nullopt;
    }
    const sys_seconds local = sys_days(day) + std::chrono::hours(hour) +
                              std::chrono::minutes(minute) + std::chrono::seconds(second);
    return platform::Timestamp{timestampOf(local - *offset)};
}

} // namespace kstd
