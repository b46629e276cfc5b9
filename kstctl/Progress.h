#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>

namespace kstctl {

/// Says on a terminal how far the work is, "kstctl: reading events: 40 %", once the program works
/// for longer than a second; again ten times a second at most. Says nothing anywhere else.
class Progress {
  public:
    using Now = std::function<std::chrono::steady_clock::time_point()>;

    /// On standard error, if that is a terminal.
    Progress();
    /// On `descriptor`, which need not be a terminal.
    Progress(int descriptor, Now now);
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;
    ~Progress() { end(); }

    /// Begins a part of the work, with so many steps.
    void begin(std::string what, std::uint64_t steps);
    /// One step more is done.
    void advance();
    /// Takes away what the terminal shows. What is written next begins on an empty line.
    void end();

  private:
    void show();

    int descriptor_;
    Now now_;
    std::chrono::steady_clock::time_point next_;
    std::string what_;
    std::uint64_t steps_ = 0;
    std::uint64_t done_ = 0;
    std::size_t shownWidth_ = 0;
};

} // namespace kstctl
