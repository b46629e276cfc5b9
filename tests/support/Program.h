#pragma once

#include "base/NotCopied.h"

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace support {

/// How long a test waits for something that must happen before it gives up. Nothing ever waits
/// this long in a run that passes.
inline constexpr std::chrono::seconds kPatience{30};

/// A program started by a test. Its standard output and standard error arrive as lines; it is
/// killed at the end of the test if it still runs.
class Program : private base::NotCopied {
  public:
    enum class Input { ofTest, pipe };

    /// `prepare` is run in the new process before it becomes the program.
    explicit Program(const std::vector<std::string>& arguments, Input input = Input::ofTest,
                     const std::function<void()>& prepare = {});
    ~Program();

    [[nodiscard]] pid_t pid() const { return pid_; }

    /// Writes a line to the program's standard input, which must be a pipe.
    void writeLine(const std::string& line) const;
    /// Ends the program's standard input, which must be a pipe.
    void endInput();

    /// Reads on until a line holds `text`, and returns that line; none when the program's output
    /// ended or patience did. Lines before it are kept in `lines`.
    std::optional<std::string> awaitLine(std::string_view text);

    /// Every line read so far.
    [[nodiscard]] const std::vector<std::string>& lines() const { return lines_; }

    /// How many of the lines read so far hold `text`.
    [[nodiscard]] std::size_t count(std::string_view text) const;

    void signal(int number) const;

    /// Waits for the end of the program, reading what it still says: its exit status, or 128 plus
    /// the number of the signal that ended it; none when patience ended.
    std::optional<int> awaitEnd();

  private:
    [[nodiscard]] bool readMore(std::chrono::steady_clock::time_point deadline);

    pid_t pid_ = -1;
    int input_ = -1;
    int output_ = -1;
    std::string partial_;
    std::vector<std::string> lines_;
    std::size_t searched_ = 0;
    bool ended_ = false;
};

} // namespace support
