#pragma once

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace bench {

/// Nanoseconds a call, one value for each round.
using Samples = std::vector<double>;

/// What is measured; it throws when it cannot do its work.
using Work = std::function<void()>;

struct Measured {
    /// For each work.
    std::vector<Samples> samples;
    /// Rounds in which this process was ready to run and had no CPU for much of the time.
    std::size_t disturbedRounds = 0;
};

/// Runs `callsPerRound` calls of each work in turn (A B C, A B C, ...), `rounds` times, so that
/// whatever disturbs the machine meets all of them alike. One round before is not counted.
[[nodiscard]] Measured interleave(int rounds, int callsPerRound, const std::vector<Work>& works);

/// The product's time against the floor's. The ratios are those of the two neighbours in each
/// round, so a machine that becomes slower for a while moves both and not their ratio.
struct Comparison {
    double floorMedian = 0;
    double productMedian = 0;
    double ratioMedian = 0;
    double ratioMin = 0;
    double ratioMax = 0;
    /// More than a tenth of the rounds were disturbed: the medians are no longer the works' own.
    bool disturbed = false;
};

/// Compares the works at these places in the list. There is at least one round.
[[nodiscard]] Comparison compare(const Measured& measured, std::size_t floor, std::size_t product);

/// The middle value, or the mean of the two middle ones; there is at least one.
[[nodiscard]] double median(Samples values);

/// The table's head, which shows how busy the machine was, and a row of it, which says whether the
/// median of the ratios is at most `target`, if there is one, or that others disturbed it.
void printHead(const std::string& title);
void printRow(const std::string& name, const Comparison& comparison,
              std::optional<double> target = std::nullopt);

} // namespace bench
