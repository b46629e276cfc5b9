#include "bench/support/Comparison.h"

#include "base/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstddef>
#include <cstdio>
#include <fcntl.h>
#include <iterator>
#include <stdlib.h>
#include <sys/types.h>
#include <unistd.h>

namespace bench {

namespace {

constexpr double kNanosecondsPerMicrosecond = 1000;
constexpr int kNameWidth = 48;

/// A sample that has waited for a CPU for more than this share of its time is disturbed. The two
/// ends of a round trip on one CPU wait for each other for up to half of it.
constexpr double kDisturbedShare = 0.75;

using Clock = std::chrono::steady_clock;

double nanosecondsPerCall(int calls, const Work& work) {
    const auto start = Clock::now();
    for (int call = 0; call < calls; ++call) {
        work();
    }
    return std::chrono::duration<double, std::nano>(Clock::now() - start).count() / calls;
}

/// How long this process has been ready to run without a CPU.
class WaitingTime {
  public:
    /// In nanoseconds, from the start of the process; 0 when the system does not say.
    [[nodiscard]] double soFar() const {
        std::array<char, 64> text{};
        const ssize_t length = ::pread(statistics_.get(), text.data(), text.size() - 1, 0);
        double waited = 0;
        // The time that it ran, then the time that it waited.
        return length > 0 && std::sscanf(text.data(), "%*u %lf", &waited) == 1 ? waited : 0;
    }

  private:
    base::FileDescriptor statistics_{::open("/proc/self/schedstat", O_RDONLY | O_CLOEXEC)};
};

struct Sample {
    double nanosecondsPerCall;
    bool disturbed;
};

Sample sample(int calls, const Work& work, const WaitingTime& waiting) {
    const double before = waiting.soFar();
    const double time = nanosecondsPerCall(calls, work);
    return {time, waiting.soFar() - before > kDisturbedShare * time * calls};
}

const char* verdict(const Comparison& comparison, std::optional<double> target) {
    if (comparison.disturbed) {
        return " disturbed";
    }
    if (!target) {
        return "";
    }
    return comparison.ratioMedian <= *target ? " met" : " missed";
}

} // namespace

Measured interleave(int rounds, int callsPerRound, const std::vector<Work>& works) {
    Measured measured;
    measured.samples.resize(works.size());
    for (const Work& work : works) {
        nanosecondsPerCall(callsPerRound, work);
    }
    const WaitingTime waiting;
    for (int round = 0; round < rounds; ++round) {
        bool disturbed = false;
        for (std::size_t i = 0; i < works.size(); ++i) {
            const Sample taken = sample(callsPerRound, works[i], waiting);
            measured.samples[i].push_back(taken.nanosecondsPerCall);
            disturbed = disturbed || taken.disturbed;
        }
        measured.disturbedRounds += disturbed ? 1 : 0;
    }
    return measured;
}

Comparison compare(const Measured& measured, std::size_t floor, std::size_t product) {
    const Samples& floors = measured.samples[floor];
    const Samples& products = measured.samples[product];
    Samples ratios;
    std::transform(products.begin(), products.end(), floors.begin(), std::back_inserter(ratios),
                   [](double ofProduct, double ofFloor) { return ofProduct / ofFloor; });
    const auto [min, max] = std::minmax_element(ratios.begin(), ratios.end());
    return {median(floors), median(products),
            median(ratios), *min,
            *max,           10 * measured.disturbedRounds > ratios.size()};
}

double median(Samples values) {
    std::sort(values.begin(), values.end());
    const std::size_t half = values.size() / 2;
    return values.size() % 2 == 1 ? values[half] : (values[half - 1] + values[half]) / 2;
}

void printHead(const std::string& title) {
    double load = 0;
    static_cast<void>(::getloadavg(&load, 1));
    std::printf("%s\n(the machine's load in the minute before: %.2f)\n", title.c_str(), load);
    std::printf("%-*s %11s %11s %7s %15s %7s\n", kNameWidth, "", "floor", "product", "ratio",
                "min .. max", "target");
}

void printRow(const std::string& name, const Comparison& comparison, std::optional<double> target) {
    const bool isShort = comparison.floorMedian < kNanosecondsPerMicrosecond;
    const char* unit = isShort ? "ns" : "us";
    const double nanoseconds = isShort ? 1 : kNanosecondsPerMicrosecond;
    std::printf("%-*s %8.2f %s %8.2f %s %7.3f %6.2f .. %5.2f", kNameWidth, name.c_str(),
                comparison.floorMedian / nanoseconds, unit, comparison.productMedian / nanoseconds,
                unit, comparison.ratioMedian, comparison.ratioMin, comparison.ratioMax);
    if (target) {
        std::printf(" %7.2f", *target);
    } else {
        std::printf(" %7s", "-");
    }
    std::printf("%s\n", verdict(comparison, target));
    std::fflush(stdout);
}

} // namespace bench
