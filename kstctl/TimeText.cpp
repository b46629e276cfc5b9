#include "kstctl/TimeText.h"

#include "kstd/Analytics/SQLite/DateFormatter.h"

#include <charconv>
#include <system_error>

namespace kstctl {

namespace {

constexpr std::size_t kDecimals = 9;
constexpr std::int64_t kEndOfYear9999 = 253'402'300'800;

std::optional<std::int64_t> digits(std::string_view text) {
    std::int64_t number = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    if (text.empty() || text.front() == '-' || result.ec != std::errc() || result.ptr != end) {
        return std::nullopt;
    }
    return number;
}

std::optional<platform::Date> dateOf(std::int64_t seconds, std::int64_t nanoseconds) {
    std::int64_t all = 0;
    if (__builtin_mul_overflow(seconds, platform::kNanosecondsPerSecond, &all) ||
        __builtin_add_overflow(all, nanoseconds, &all)) {
        return std::nullopt;
    }
    return platform::Date{all};
}

std::optional<platform::Date> dateOfSeconds(std::string_view text) {
    const std::size_t point = text.find('.');
    const auto seconds = digits(text.substr(0, point));
    if (!seconds || point == std::string_view::npos) {
        return seconds ? dateOf(*seconds, 0) : std::nullopt;
    }
    std::string decimals(text.substr(point + 1));
    if (decimals.empty() || decimals.size() > kDecimals) {
        return std::nullopt;
    }
    decimals.resize(kDecimals, '0');
    const auto nanoseconds = digits(decimals);
    return nanoseconds ? dateOf(*seconds, *nanoseconds) : std::nullopt;
}

} // namespace

std::string timeText(platform::Timestamp time) {
    return kstd::DateFormatter().text(time);
}

std::string timeText(platform::Date time) {
    return timeText(platform::timestampOf(time));
}

std::string timeText(std::uint64_t secondsSince1970) {
    if (secondsSince1970 == 0 || secondsSince1970 >= kEndOfYear9999) {
        return {};
    }
    return timeText(platform::Timestamp{static_cast<double>(secondsSince1970) -
                                        static_cast<double>(platform::kSecondsFrom1970To2001)});
}

std::optional<platform::Date> dateOfText(std::string_view text) {
    const auto written = kstd::DateFormatter().date(text);
    if (!written) {
        return dateOfSeconds(text);
    }
    // Whole seconds of a year with four digits: exact.
    return dateOf(
        static_cast<std::int64_t>(written->secondsSince2001) + platform::kSecondsFrom1970To2001, 0);
}

} // namespace kstctl
