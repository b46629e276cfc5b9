#pragma once

#include <string>
#include <string_view>

/// The lines of a program as they leave it: in the journal, each with the identifier of its class
/// and its level, or on standard error, one line each, where there is no journal.
namespace keystrand {

/// Where the journal takes its messages.
inline constexpr char kJournalSocket[] = "/run/systemd/journal/socket";

enum class LineTarget { journal, standardError };

/// The journal for a program that works on the machine itself, and only if there is one. What works
/// under another root than "/" keeps its lines to itself.
[[nodiscard]] LineTarget lineTargetFor(std::string_view root,
                                       const char* journalSocket = kJournalSocket);

struct ProgramLine {
    /// By which name the journal finds it.
    std::string_view program;
    /// By which lines of the class are found. Never given to another class.
    std::string_view messageId;
    /// By the numbers of syslog.
    int level = 0;
    /// Without its end; bytes of others are escaped already.
    std::string_view text;
};

/// What the journal does not take goes to standard error.
void writeLine(LineTarget target, const ProgramLine& line);

} // namespace keystrand
