#pragma once

#include "platform/MessageClass.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <cstddef>
#include <span>
#include <string>

namespace platform {

/// The system's log on Linux: the native journal, with the severity and the place in the code as
/// fields of their own, or standard error, one plain line each.
///
/// A line goes to the journal when its socket is there and takes it. That is looked at for every
/// line, because the journal may come or go, and because libsystemd says yes to a line that it
/// dropped for want of a journal. libsystemd knows only the socket of the real system, so under
/// another root than "/" every line goes to standard error.
class LinuxSystemLog final : public SystemLog {
  public:
    /// In the journal a line of one of the classes has that class's identifier. The classes must
    /// outlive the log.
    explicit LinuxSystemLog(const Paths& paths, std::span<const MessageClass> classes = {});

    void write(LogLevel level, std::string_view text, const CodePlace& place) override;

    /// A longer text is cut here, at the start of a character, and ends in "...". Texts hold names
    /// from outside: nobody shall fill the log with one line.
    static constexpr std::size_t kMaxTextSize = 8192;

  private:
    /// Empty when there is no journal to write to.
    std::string journalSocket_;
    std::span<const MessageClass> classes_;
};

} // namespace platform
