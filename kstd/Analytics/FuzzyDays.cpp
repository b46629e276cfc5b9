#include "kstd/Analytics/KSTDAnalyticsLogger.h"
#include "platform/Clock.h"

#include <array>

namespace kstd {

namespace {

constexpr double kSecondsPerDay = 86400;
/// The days at which the buckets behind the first begin.
constexpr std::array<int, 4> kBuckets = {1, 7, 30, 365};

} // namespace

int KSTDAnalyticsLogger::fuzzyDaysSinceDate(platform::Timestamp date, platform::Clock& clock) {
    const double seconds =
        platform::timestampOf(clock.now()).secondsSince2001 - date.secondsSince2001;
    int bucket = 0;
    for (const int days : kBuckets) {
        if (seconds < days * kSecondsPerDay) {
            break;
        }
        bucket = days;
    }
    return bucket;
}

} // namespace kstd
