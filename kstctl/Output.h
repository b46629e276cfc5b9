#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"
#include "platform/Result.h"
#include "platform/linux/Paths.h"

#include <cerrno>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <unistd.h>

namespace kstctl {

/// Writes all of it. False, with errno set, when that is not possible.
[[nodiscard]] inline bool writeWhole(int descriptor, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t written = ::write(descriptor, bytes.data(), bytes.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        bytes.remove_prefix(written > 0 ? static_cast<std::size_t>(written) : 0);
    }
    return true;
}

/// Writes what it is given in large pieces. After the first failure nothing more is written.
class BufferedWriter {
  public:
    explicit BufferedWriter(int descriptor) : descriptor_(descriptor) {}

    void put(std::string_view bytes) {
        buffer_.append(bytes);
        if (buffer_.size() >= kPiece) {
            flush();
        }
    }

    /// Writes what is left: 0, or the number of the first error.
    [[nodiscard]] int finish() {
        flush();
        return error_;
    }

  private:
    static constexpr std::size_t kPiece = 64UL * 1024;

    void flush() {
        if (error_ == 0 && !writeWhole(descriptor_, buffer_)) {
            error_ = errno;
        }
        buffer_.clear();
    }

    int descriptor_;
    int error_ = 0;
    std::string buffer_;
};

/// What the program says: results on standard output, reasons on standard error.
///
/// What is long is written in pieces while it is made: a command begins with that when it has read
/// all that it needs, so that what cannot be read leaves no half result, and nothing is held open
/// while a slow reader is waited for.
class Output {
  public:
    explicit Output(bool isJSON, int descriptor = STDOUT_FILENO);

    [[nodiscard]] bool isJSON() const { return isJSON_; }
    /// Whether standard output is a terminal.
    [[nodiscard]] bool isTerminal() const { return isTerminal_; }
    [[nodiscard]] Colours colours() const { return colours_; }
    /// How many characters fit into a line of the terminal; none when there is no terminal, or it
    /// does not say.
    [[nodiscard]] std::optional<std::size_t> width() const { return width_; }

    /// In the form that was asked for.
    void show(const Report& report);
    /// Bytes as they are.
    void put(std::string_view bytes) { results_.put(bytes); }

    /// One line "kstctl: …" on standard error, printable.
    static void complain(std::string_view message);

    /// Writes what is left of the results. `status`, or ExitStatus::failed with a line when they
    /// could not be written.
    [[nodiscard]] ExitStatus finish(ExitStatus status);
    /// The same after a line with the error's reason.
    [[nodiscard]] ExitStatus finish(const platform::Error& error);

  private:
    bool isJSON_;
    bool isTerminal_;
    Colours colours_;
    std::optional<std::size_t> width_;
    BufferedWriter results_;
};

/// A file, for its owner alone, that was not there before. It is gone again unless it is finished.
class NewFile {
  public:
    [[nodiscard]] static platform::Result<NewFile> make(const std::string& path);

    NewFile(NewFile&& other) noexcept = default;
    NewFile& operator=(NewFile&& other) = delete;
    ~NewFile();

    void put(std::string_view bytes) { content_.put(bytes); }

    /// Why it could not be written whole.
    [[nodiscard]] std::optional<platform::Error> finish();

  private:
    NewFile(std::string path, base::FileDescriptor file);

    std::string path_;
    base::FileDescriptor file_;
    BufferedWriter content_;
};

/// Says on a terminal how far the work is, "kstctl: reading events: 40 %", once the program works
/// for longer than a second; again ten times a second at most. Says nothing anywhere else.
class Progress : private base::NotCopied {
  public:
    using Now = std::function<std::chrono::steady_clock::time_point()>;

    /// On standard error, if that is a terminal.
    Progress();
    /// On `descriptor`, which need not be a terminal.
    Progress(int descriptor, Now now);
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

/// What every command works with.
struct Environment {
    platform::Paths paths;
    Output& output;
    Progress& progress;
    /// The longest wait for a database that is locked or a socket that is full.
    std::chrono::milliseconds patience;
};

} // namespace kstctl
