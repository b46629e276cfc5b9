#pragma once

#include "base/Concat.h"
#include "tests/neighbours/Daemon.h"
#include "tests/neighbours/Random.h"
#include "tests/neighbours/Runs.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <utility>

namespace neighbours {

/// What a process may have more at the end than at first, in KiB. A sanitizer keeps freed memory on
/// purpose.
[[nodiscard]] constexpr std::size_t mostGrowth([[maybe_unused]] std::size_t kilobytes) {
#ifdef KSTD_SANITIZED
    return 400'000;
#else
    return kilobytes;
#endif
}

/// The footprints of one process, early and late.
class Growth {
  public:
    explicit Growth(std::size_t most) : most_(most) {}

    void look(const Footprint& now) {
        now_ = now;
        if (first_.descriptors == 0) {
            first_ = now_;
        }
        require(
            now_.descriptors == first_.descriptors,
            base::concat(now_.descriptors, " descriptors in the place of ", first_.descriptors));
        require(now_.kilobytes <= first_.kilobytes + most_,
                base::concat(now_.kilobytes, " KiB in the place of ", first_.kilobytes));
    }

    [[nodiscard]] std::string text() const {
        return base::concat("descriptors ", first_.descriptors, " -> ", now_.descriptors,
                            ", memory ", first_.kilobytes, " -> ", now_.kilobytes, " KiB");
    }

  private:
    std::size_t most_;
    Footprint first_;
    Footprint now_;
};

/// A run in batches: each has ideas of its own, and is followed by a look at who is tried.
class Batches {
  public:
    Batches(const RunOptions& options, const char* name)
        : options_(options), name_(name), batch_(options.firstBatch) {}

    [[nodiscard]] std::uint64_t seed() const { return options_.seed * 1'000'003 + batch_; }
    [[nodiscard]] Random ideas() const { return Random(seed()); }
    [[nodiscard]] std::uint64_t number() const { return batch_; }
    /// How many waits for somebody silent this one may have: the first one has them all.
    [[nodiscard]] std::size_t silences() const {
        return batch_ == options_.firstBatch ? options_.silences : 0;
    }

    /// Whether another one is to be made.
    [[nodiscard]] bool end(std::uint64_t exchanges) {
        ++batch_;
        exchanges_ = exchanges;
        return exchanges_ < options_.count;
    }

    /// What was done, as a line.
    [[nodiscard]] std::string text(const std::string& rest) const;
    void print(const std::string& rest) const;

    /// What is to be said as well when something was wrong.
    void setReport(std::function<std::string()> report) { report_ = std::move(report); }
    /// Runs `work`, and says where it was when something was wrong.
    void guard(const std::function<void()>& work) const;

  private:
    const RunOptions& options_;
    const char* name_;
    std::uint64_t batch_;
    std::uint64_t exchanges_ = 0;
    std::function<std::string()> report_ = [] {
        return std::string();
    };
    std::chrono::steady_clock::time_point begin_ = std::chrono::steady_clock::now();
};

} // namespace neighbours
