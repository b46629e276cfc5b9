#include "kstd-notify/Notify.h"

#include "base/ByteWriter.h"
#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "kstd-notify/AlarmHelper.h"
#include "kstd-notify/SystemdAlarmTimer.h"
#include "platform/ManagedSettings.h"
#include "platform/SystemLog.h"
#include "platform/host/LogText.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "wire/EventDatagram.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <sys/socket.h>
#include <sys/time.h>
#include <system_error>
#include <utility>
#include <vector>

namespace notify {

namespace {

/// One event for the daemon.
struct Notice {
    std::string stream;
    std::string name;
    std::vector<std::uint8_t> payload;
};

std::vector<std::uint8_t> bytesOf(platform::Date date) {
    std::vector<std::uint8_t> bytes(sizeof date.nanosecondsSince1970);
    base::ByteWriter writer(bytes);
    static_cast<void>(writer.writeU64(static_cast<std::uint64_t>(date.nanosecondsSince1970)));
    return bytes;
}

/// The managed settings have changed.
Notice settingsNotice() {
    return {wire::kNotifydMatchingStream, platform::kSettingsChangedEvent, {}};
}

/// One for each registered alarm. One that is due carries its date and fires. One that is not
/// carries the present date, which fires nothing: the daemon then arms the alarm again.
std::vector<Notice> alarmNotices(const platform::Paths& paths, platform::Clock& clock,
                                 platform::SystemLog& log) {
    std::vector<Notice> notices;
    const platform::Date now = clock.now();
    for (const auto& [event, date] :
         platform::AlarmStore(paths.alarmDirectory(), {wire::kAlarmName}, log)
             .load(wire::kAlarmStream)) {
        notices.push_back({wire::kAlarmStream, event, bytesOf(std::min(date, now))});
    }
    return notices;
}

/// The notices of one subject, "alarm" or "settings"; none when there is no such subject.
std::optional<std::vector<Notice>> noticesOf(std::string_view subject, const platform::Paths& paths,
                                             platform::Clock& clock, platform::SystemLog& log) {
    if (subject == "settings") {
        return std::vector{settingsNotice()};
    }
    if (subject == "alarm") {
        return alarmNotices(paths, clock, log);
    }
    return std::nullopt;
}

/// A socket that waits for room, but not for ever.
base::FileDescriptor patientSocket(std::chrono::milliseconds patience) {
    base::FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(patience);
    const timeval time{seconds.count(), std::chrono::microseconds(patience - seconds).count()};
    if (socket.isOpen() &&
        ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &time, sizeof time) != 0) {
        socket.reset();
    }
    return socket;
}

std::string reasonFor(int error) {
    return error == EAGAIN ? "the daemon takes no events, its queue is full"
                           : std::generic_category().message(error);
}

/// Sends notices to the daemon's socket. What was sent is handled by the running daemon, or
/// launches one.
class NoticeSender {
  public:
    /// `patience` is how long one event waits for room in the socket's queue.
    NoticeSender(std::string socketPath, std::chrono::milliseconds patience);

    /// Why it was not sent; empty when it was.
    [[nodiscard]] std::string send(const Notice& notice);

  private:
    std::string path_;
    base::FileDescriptor socket_;
};

NoticeSender::NoticeSender(std::string socketPath, std::chrono::milliseconds patience)
    : path_(std::move(socketPath)), socket_(patientSocket(patience)) {}

std::string NoticeSender::send(const Notice& notice) {
    const auto datagram = wire::encodeEvent(notice.stream, notice.name, notice.payload);
    const auto address = base::UnixAddress::of(path_);
    if (!datagram || !address) {
        return datagram ? "the socket's path is too long" : "the event's name does not fit";
    }
    if (!socket_.isOpen()) {
        return "there is no socket to send from";
    }
    ssize_t sent = -1;
    do {
        sent = ::sendto(socket_.get(), datagram->data(), datagram->size(), MSG_NOSIGNAL,
                        address->get(), address->size());
    } while (sent < 0 && errno == EINTR);
    return sent < 0 ? reasonFor(errno) : std::string();
}

constexpr char kUsage[] = "usage: kstd-notify alarm|arm|settings\n"
                          "  alarm     tell the daemon of every registered alarm\n"
                          "  arm       make the timer of the earliest alarm\n"
                          "  settings  tell the daemon that the managed settings have changed\n";

/// The log of a program whose standard error is in the journal.
class StreamLog final : public platform::SystemLog {
  public:
    explicit StreamLog(std::ostream& stream) : stream_(stream) {}

    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        stream_ << platform::printableLine(text) << '\n';
    }

  private:
    std::ostream& stream_;
};

ExitStatus arm(const platform::Paths& paths, platform::Clock& clock, std::ostream& errors) {
    // What fails here for a moment, the daemon may never see.
    StreamLog log(errors);
    platform::AlarmStore store(paths.alarmDirectory(), {wire::kAlarmName}, log);
    SystemdAlarmTimer unit(paths.systemBus());
    AlarmTimer timer(unit, clock, AlarmTimer::machineHere());
    AlarmHelper helper(takeActivatedAlarmSocket(), store, unit, timer, clock, errors);
    return helper.run() ? kSent : kNotSent;
}

} // namespace

ExitStatus run(std::span<const std::string_view> arguments, const platform::Paths& paths,
               platform::Clock& clock, std::chrono::milliseconds patience, std::ostream& errors) {
    if (arguments.size() == 1 && arguments.front() == "arm") {
        return arm(paths, clock, errors);
    }
    StreamLog log(errors);
    const auto notices =
        arguments.size() == 1 ? noticesOf(arguments.front(), paths, clock, log) : std::nullopt;
    if (!notices) {
        errors << kUsage;
        return kWrongUsage;
    }
    NoticeSender sender(paths.eventSocket(), patience);
    ExitStatus status = kSent;
    for (const Notice& notice : *notices) {
        if (const std::string reason = sender.send(notice); !reason.empty()) {
            errors << "kstd-notify: cannot send " << platform::printableLine(notice.name) << " to "
                   << paths.eventSocket() << ": " << reason << '\n';
            status = kNotSent;
        }
    }
    return status;
}

} // namespace notify
