#include "keystrand/JournalLines.h"

#include "base/Concat.h"

#include <cerrno>
#include <sys/uio.h>
#include <unistd.h>

// Where in this file the line was written tells nobody anything.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

namespace keystrand {

namespace {

bool sendToJournal(const ProgramLine& line) {
    const std::string fields[] = {
        base::concat("MESSAGE=", line.text), base::concat("MESSAGE_ID=", line.messageId),
        base::concat("PRIORITY=", line.level), base::concat("SYSLOG_IDENTIFIER=", line.program)};
    iovec parts[std::size(fields)];
    for (std::size_t i = 0; i < std::size(fields); ++i) {
        // The library only reads from it.
        parts[i] = {const_cast<char*>(fields[i].data()), fields[i].size()};
    }
    return ::sd_journal_sendv(parts, std::size(parts)) >= 0;
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

LineTarget lineTargetFor(std::string_view root, const char* journalSocket) {
    return root == "/" && ::access(journalSocket, F_OK) == 0 ? LineTarget::journal
                                                             : LineTarget::standardError;
}

void writeLine(LineTarget target, const ProgramLine& line) {
    if (target != LineTarget::journal || !sendToJournal(line)) {
        writeToStandardError(std::string(line.text));
    }
}

} // namespace keystrand
