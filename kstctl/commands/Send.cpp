#include "base/ByteWriter.h"
#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/Report.h"
#include "kstctl/commands/Inputs.h"
#include "kstctl/status/DaemonSockets.h"
#include "kstctl/status/RegisteredAlarms.h"
#include "wire/EventDatagram.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <poll.h>
#include <span>
#include <sys/socket.h>

namespace kstctl {

namespace {

using Clock = std::chrono::steady_clock;

platform::Bytes payloadOf(platform::Date date) {
    platform::Bytes payload(sizeof date.nanosecondsSince1970);
    base::ByteWriter writer(payload);
    // It has just that room.
    static_cast<void>(writer.writeU64(static_cast<std::uint64_t>(date.nanosecondsSince1970)));
    return payload;
}

/// The date that the alarm is registered for: the daemon drops an alarm's event with another one.
platform::Result<platform::Bytes> registeredDate(const EventName& name,
                                                 const platform::Paths& paths) {
    const auto alarms = registeredAlarms(paths);
    if (!alarms) {
        return alarms.error();
    }
    for (const RegisteredAlarm& alarm : alarms.value()) {
        if (alarm.stream == name.stream && alarm.event == name.name && alarm.problem.empty()) {
            return payloadOf(alarm.date);
        }
    }
    return failure(ExitStatus::failed,
                   base::concat("no alarm ", name.name, " is registered; give its --date"));
}

platform::Result<platform::Bytes> payloadOf(const SendCommand& command, const EventName& name,
                                            const platform::Paths& paths) {
    if (command.payload) {
        auto bytes = bytesOfHex(*command.payload);
        return bytes ? bytes
                     : failure(ExitStatus::usage, base::concat("--payload ", *command.payload, ": ",
                                                               bytes.error().description));
    }
    if (command.date) {
        const auto date = dateOfText(*command.date);
        return date ? platform::Result<platform::Bytes>(payloadOf(*date))
                    : failure(ExitStatus::usage, base::concat("no date: ", *command.date));
    }
    return name.stream == wire::kAlarmStream ? registeredDate(name, paths) : platform::Bytes();
}

/// 0, or the error's number. A full socket is waited for.
int sendDatagram(int socket, std::span<const std::uint8_t> datagram,
                 std::chrono::milliseconds patience) {
    const Clock::time_point deadline = Clock::now() + patience;
    for (;;) {
        if (::send(socket, datagram.data(), datagram.size(), MSG_NOSIGNAL) >= 0) {
            return 0;
        }
        if (errno != EAGAIN && errno != EINTR) {
            return errno;
        }
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
        pollfd watched{socket, POLLOUT, 0};
        if (left.count() <= 0 || ::poll(&watched, 1, static_cast<int>(left.count())) == 0) {
            return EAGAIN;
        }
    }
}

platform::Error sendError(const std::string& path, int error) {
    if (error == EAGAIN) {
        return failure(ExitStatus::failed,
                       base::concat("the event socket ", path, " is full and nobody empties it"));
    }
    if (error == ECONNREFUSED) {
        return failure(ExitStatus::missing,
                       base::concat("nobody keeps the event socket ", path, " open"));
    }
    return fileError(path, error);
}

} // namespace

ExitStatus run(const SendCommand& command, const Environment& environment) {
    const auto name = findEventName(command);
    if (!name) {
        return environment.output.finish(name.error());
    }
    const auto payload = payloadOf(command, name.value(), environment.paths);
    if (!payload) {
        return environment.output.finish(payload.error());
    }
    const auto datagram =
        wire::encodeEvent(name.value().stream, name.value().name, payload.value());
    if (!datagram) {
        return environment.output.finish(failure(
            ExitStatus::malformed, "an event of these names and this payload cannot be expressed"));
    }
    // Last, so that a mistake is told whether a daemon is there or not.
    const EventSocketFile socket = EventSocketFile::look(environment.paths);
    if (socket.problem) {
        return environment.output.finish(*socket.problem);
    }
    if (const int error = sendDatagram(socket.connection.get(), *datagram, environment.patience);
        error != 0) {
        return environment.output.finish(sendError(socket.path, error));
    }
    if (environment.output.isJSON()) {
        environment.output.show(Report()
                                    .add("stream", name.value().stream)
                                    .add("name", name.value().name)
                                    .add("payload", hexText(payload.value()))
                                    .add("size", datagram->size()));
    }
    return environment.output.finish(ExitStatus::success);
}

} // namespace kstctl
