#include "kstctl/Progress.h"

#include "base/Concat.h"
#include "kstctl/WholeWrite.h"

#include <algorithm>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

constexpr std::chrono::seconds kSilence{1};
constexpr std::chrono::milliseconds kBetweenTwo{100};
constexpr std::uint64_t kWhole = 100;

} // namespace

Progress::Progress()
    : Progress(::isatty(STDERR_FILENO) == 1 ? STDERR_FILENO : -1,
               [] { return std::chrono::steady_clock::now(); }) {}

Progress::Progress(int descriptor, Now now)
    : descriptor_(descriptor), now_(std::move(now)), next_(now_() + kSilence) {}

void Progress::begin(std::string what, std::uint64_t steps) {
    what_ = std::move(what);
    steps_ = steps;
    done_ = 0;
}

void Progress::advance() {
    ++done_;
    if (descriptor_ < 0) {
        return;
    }
    if (const auto now = now_(); now > next_) {
        next_ = now + kBetweenTwo;
        show();
    }
}

void Progress::show() {
    const std::uint64_t share = done_ < steps_ ? done_ * kWhole / steps_ : kWhole;
    std::string line = base::concat("kstctl: ", what_, ": ", share, " %");
    const std::size_t width = line.size();
    line.resize(std::max(width, shownWidth_), ' ');
    shownWidth_ = width;
    // What a terminal was not shown is no loss.
    static_cast<void>(writeWhole(descriptor_, base::concat('\r', line)));
}

void Progress::end() {
    if (shownWidth_ > 0) {
        static_cast<void>(
            writeWhole(descriptor_, base::concat('\r', std::string(shownWidth_, ' '), '\r')));
        shownWidth_ = 0;
    }
}

} // namespace kstctl
