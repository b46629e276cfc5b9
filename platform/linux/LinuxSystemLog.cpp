#include "platform/linux/LinuxSystemLog.h"

#include "base/Concat.h"
#include "platform/shared/LogText.h"
#include "platform/shared/MessageClasses.h"

// The fields of the code's place are the caller's, not this file's.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include <cerrno>
#include <sys/uio.h>
#include <syslog.h>
#include <unistd.h>
#include <vector>

namespace platform {

namespace {

constexpr std::string_view kIdentifier = "kstd";
constexpr std::string_view kEllipsis = "...";

int priorityOf(LogLevel level) {
    switch (level) {
    case LogLevel::debug:
        return LOG_DEBUG;
    case LogLevel::info:
        return LOG_INFO;
    case LogLevel::warning:
        return LOG_WARNING;
    case LogLevel::error:
        return LOG_ERR;
    }
    return LOG_ERR;
}

/// The bytes of UTF-8 that are not the first of their character.
bool continuesCharacter(char byte) {
    return (static_cast<unsigned char>(byte) & 0xc0U) == 0x80U;
}

std::string boundedLine(std::string_view text) {
    if (text.ends_with('\n')) {
        text.remove_suffix(1);
    }
    if (text.size() <= LinuxSystemLog::kMaxTextSize) {
        return logLine(base::concat(text, '\n'));
    }
    // A character has at most three further bytes; text that is not UTF-8 is cut anywhere.
    std::size_t end = LinuxSystemLog::kMaxTextSize;
    for (int steps = 0; steps < 3 && continuesCharacter(text[end]); ++steps) {
        --end;
    }
    return logLine(base::concat(text.substr(0, end), kEllipsis));
}

bool sendToJournal(LogLevel level, const std::string& line, std::string_view messageId,
                   const CodePlace& place) {
    std::vector<std::string> fields = {
        base::concat("MESSAGE=", line),
        base::concat("PRIORITY=", priorityOf(level)),
        base::concat("SYSLOG_IDENTIFIER=", kIdentifier),
    };
    if (!messageId.empty()) {
        fields.push_back(base::concat("MESSAGE_ID=", messageId));
    }
    if (!place.file.empty()) {
        fields.push_back(base::concat("CODE_FILE=", place.file));
    }
    if (place.line > 0) {
        fields.push_back(base::concat("CODE_LINE=", place.line));
    }
    if (!place.function.empty()) {
        fields.push_back(base::concat("CODE_FUNC=", place.function));
    }
    std::vector<iovec> parts;
    parts.reserve(fields.size());
    for (std::string& field : fields) {
        parts.push_back({field.data(), field.size()});
    }
    return ::sd_journal_sendv(parts.data(), static_cast<int>(parts.size())) == 0;
}

/// One line in one write where the system takes it whole. What cannot be written is lost.
void writeToStandardError(std::string line) {
    line += '\n';
    std::string_view rest = line;
    while (!rest.empty()) {
        const ssize_t written = ::write(STDERR_FILENO, rest.data(), rest.size());
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return;
        }
        rest.remove_prefix(static_cast<std::size_t>(written));
    }
}

} // namespace

LinuxSystemLog::LinuxSystemLog(const Paths& paths, std::span<const MessageClass> classes)
    : journalSocket_(paths.isSystemRoot() ? paths.journalSocket() : std::string()),
      classes_(classes) {}

void LinuxSystemLog::write(LogLevel level, std::string_view text, const CodePlace& place) {
    std::string line = boundedLine(text);
    const bool hasJournal = !journalSocket_.empty() && ::access(journalSocket_.c_str(), F_OK) == 0;
    if (!hasJournal || !sendToJournal(level, line, messageIdOf(line, classes_), place)) {
        writeToStandardError(std::move(line));
    }
}

} // namespace platform
