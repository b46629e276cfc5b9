#pragma once

#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <string_view>

namespace platform {

/// The system's log on Linux: the journal, in its own protocol, with the severity and the place in
/// the code as fields of their own, or standard error, one plain line each.
///
/// A line goes to the journal when that takes it. This is tried for every line, over a socket of
/// its own, because the journal may come or go, and because the descriptors of a program that uses
/// the library are not ours to keep. Under another root than "/" there is no journal.
///
/// Nothing is allocated and nothing is thrown: a line is built on the stack, 5 KiB for a text of up
/// to 1 KiB, 36 KiB for a longer one. Nor is anything kept between two lines, so that a process may
/// fork at any time. A journal that takes nothing for a second loses its line to standard error.
class LinuxSystemLog final : public SystemLog {
  public:
    /// In the journal lines are `identifier`'s, which must outlive the log, and have the
    /// identifiers of their classes. When it is empty, they are this program's, and no line has a
    /// class: the classes are the daemon's, and what is said of them is wrong for another program.
    explicit LinuxSystemLog(const Paths& paths, std::string_view identifier = {}) noexcept
        : hasJournal_(paths.isSystemRoot()), identifier_(identifier) {}

    void write(LogLevel level, std::string_view text, const LogFields& fields) noexcept override;

    /// A longer text is cut here, at the start of a character, and ends in "...". Texts hold names
    /// from outside: nobody shall fill the log with one line.
    static constexpr std::size_t kMaxTextSize = 8192;

  private:
    template <std::size_t Room>
    void writeOnStack(LogLevel level, std::string_view text, const LogFields& fields) noexcept;

    [[nodiscard]] bool sendToJournal(LogLevel level, std::string_view line,
                                     const LogFields& fields) const noexcept;

    bool hasJournal_;
    std::string_view identifier_;
};

} // namespace platform
