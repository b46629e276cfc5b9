#include "platform/linux/LinuxSystemLog.h"

#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "platform/host/LogText.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <endian.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <syslog.h>
#include <unistd.h>

namespace platform {

namespace {

constexpr std::string_view kEllipsis = "...";

/// The usual line is shorter; the threads of the library's clients may have small stacks.
constexpr std::size_t kUsualTextSize = 1024;

/// The longest name that a program's file can have.
constexpr std::size_t kMaxIdentifierSize = 255;

/// How long a journal that is there may take nothing.
constexpr timeval kJournalPatience = {1, 0};

std::string_view priorityOf(LogLevel level) {
    switch (level) {
    case LogLevel::debug:
        return "7";
    case LogLevel::info:
        return "6";
    case LogLevel::notice:
        return "5";
    case LogLevel::warning:
        return "4";
    case LogLevel::error:
        return "3";
    }
    return "3";
}

/// The program's name as it was started under, which is not our text and may be empty.
std::string_view programName() {
    const char* const name = program_invocation_short_name;
    return name == nullptr ? std::string_view()
                           : std::string_view(name, ::strnlen(name, kMaxIdentifierSize));
}

/// The bytes of UTF-8 that are not the first of their character.
bool continuesCharacter(char byte) {
    return (static_cast<unsigned char>(byte) & 0xc0U) == 0x80U;
}

/// What is kept of a text that is too long.
std::string_view beginningOf(std::string_view text) {
    // A character has at most three further bytes; text that is not UTF-8 is cut anywhere.
    std::size_t end = LinuxSystemLog::kMaxTextSize;
    for (int steps = 0; steps < 3 && continuesCharacter(text[end]); ++steps) {
        --end;
    }
    return text.substr(0, end);
}

/// A message in the journal's own protocol: for each field its name and a newline, the length of
/// the value in eight bytes, the value, and a newline. Values lie where they are and must stay
/// there.
class JournalMessage {
  public:
    void add(std::string_view nameAndNewline, std::string_view value) {
        std::uint64_t& length = lengths_[fieldCount_++];
        length = htole64(value.size());
        addPart(nameAndNewline);
        addPart({reinterpret_cast<const char*>(&length), sizeof length});
        addPart(value);
        addPart("\n");
    }

    void addIfAny(std::string_view nameAndNewline, std::string_view value) {
        if (!value.empty()) {
            add(nameAndNewline, value);
        }
    }

    [[nodiscard]] bool send() {
        const auto address = base::UnixAddress::of(Paths::kJournalSocket);
        const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        if (!address || !socket.isOpen()) {
            return false;
        }
        msghdr message{};
        message.msg_name = const_cast<sockaddr*>(address->get());
        message.msg_namelen = address->size();
        message.msg_iov = parts_.data();
        message.msg_iovlen = partCount_;
        if (sendOnce(socket.get(), message, MSG_DONTWAIT)) {
            return true;
        }
        if (errno != EAGAIN) {
            return false;
        }
        ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &kJournalPatience,
                     sizeof kJournalPatience);
        return sendOnce(socket.get(), message, 0);
    }

  private:
    static constexpr std::size_t kMaxFields = 7;

    static bool sendOnce(int socket, const msghdr& message, int flags) {
        ssize_t sent = -1;
        do {
            sent = ::sendmsg(socket, &message, flags | MSG_NOSIGNAL);
        } while (sent < 0 && errno == EINTR);
        return sent >= 0;
    }

    void addPart(std::string_view part) {
        // The system only reads from it.
        parts_[partCount_++] = {const_cast<char*>(part.data()), part.size()};
    }

    std::array<iovec, kMaxFields * 4> parts_;
    std::size_t partCount_ = 0;
    std::array<std::uint64_t, kMaxFields> lengths_;
    std::size_t fieldCount_ = 0;
};

/// One line in one write where the system takes it whole. What cannot be written is lost.
void writeToStandardError(std::string_view line) {
    while (!line.empty()) {
        const ssize_t written = ::write(STDERR_FILENO, line.data(), line.size());
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return;
        }
        line.remove_prefix(static_cast<std::size_t>(written));
    }
}

} // namespace

bool LinuxSystemLog::sendToJournal(LogLevel level, std::string_view line,
                                   const LogFields& fields) const noexcept {
    char digits[16];
    const auto digitsEnd = std::to_chars(std::begin(digits), std::end(digits), fields.line).ptr;
    JournalMessage message;
    message.add("MESSAGE\n", line);
    message.add("PRIORITY\n", priorityOf(level));
    message.addIfAny("SYSLOG_IDENTIFIER\n", identifier_.empty() ? programName() : identifier_);
    if (!identifier_.empty()) {
        message.addIfAny("MESSAGE_ID\n", fields.messageId);
    }
    message.addIfAny("CODE_FILE\n", fields.file);
    if (fields.line > 0) {
        message.add("CODE_LINE\n", {digits, static_cast<std::size_t>(digitsEnd - digits)});
    }
    message.addIfAny("CODE_FUNC\n", fields.function);
    return message.send();
}

/// Not inlined, so that a short line does not take the stack of a long one.
template <std::size_t Room>
[[gnu::noinline]] void LinuxSystemLog::writeOnStack(LogLevel level, std::string_view text,
                                                    const LogFields& fields) noexcept {
    constexpr std::size_t kNewlineSize = 1;
    std::array<char, Room * kLogTextGrowth + kEllipsis.size() + kNewlineSize> buffer;
    char* end = nullptr;
    if (text.size() <= Room) {
        end = showLogText(text, buffer.data());
    } else {
        end = showLogText(beginningOf(text), buffer.data());
        end = std::copy(kEllipsis.begin(), kEllipsis.end(), end);
    }
    const auto size = static_cast<std::size_t>(end - buffer.data());
    if (!hasJournal_ || !sendToJournal(level, {buffer.data(), size}, fields)) {
        *end = '\n';
        writeToStandardError({buffer.data(), size + kNewlineSize});
    }
}

void LinuxSystemLog::write(LogLevel level, std::string_view text,
                           const LogFields& fields) noexcept {
    const int error = errno;
    text = withoutFinalNewline(text);
    if (text.size() <= kUsualTextSize) {
        writeOnStack<kUsualTextSize>(level, text, fields);
    } else {
        writeOnStack<kMaxTextSize>(level, text, fields);
    }
    errno = error;
}

} // namespace platform
