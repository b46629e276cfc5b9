#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "platform/Host.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "platform/linux/StopRequest.h"
#include "wire/EventDatagram.h"

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace platform {

/// How a program wants its host to be.
struct LinuxHostOptions {
    /// Where the system's paths begin.
    Paths paths{"/"};
    /// Where events come from; without one the host has no event socket.
    base::FileDescriptor eventSocket{};
    /// How long the process stays idle before the host closes its streams; none is for ever.
    std::optional<std::chrono::milliseconds> idleTime = std::nullopt;
    /// Where the host and the program write their lines, in place of the system's log; it outlives
    /// the host.
    SystemLog* log = nullptr;
    /// What asks the process to end; it outlives the host. The host then closes its streams as soon
    /// as the event in hand is handled, and ends every HTTPS request at once.
    const StopRequest* stop = nullptr;
    /// The names that alarms may have.
    std::vector<std::string> alarms{wire::kAlarmName};
    /// Where the HTTPS client is; with neither socket nor program, behind paths.httpsSocket().
    RemoteHTTPOptions https{};
};

/// All interfaces of the platform on this machine, made and owned in one place.
///
/// Handlers and what they hold are destroyed first when the host goes, while every interface that
/// they use is still there.
class LinuxHost : private base::NotCopied {
  public:
    /// Throws, and leaves a line, when the system refuses what the host cannot be without:
    /// descriptors, above all (std::system_error), or memory.
    explicit LinuxHost(LinuxHostOptions options);
    ~LinuxHost();

    [[nodiscard]] Host interfaces();

    /// Runs `program`, and returns what the process is to end with: what the program returned. When
    /// the system has failed under it, so that it could not go on, that is EXIT_FAILURE, a line
    /// says why, and what had failed to get onto disk was tried once more.
    [[nodiscard]] int run(const std::function<int(const Host& host)>& program);

    /// Takes the run loop's sources away, as the end of an idle process does: no event is received
    /// any more, and the loop cannot be run once what was received is delivered. What waits in the
    /// event socket stays there and launches the next process. Once is enough.
    void closeStreams();

  private:
    struct Parts;
    std::unique_ptr<Parts> parts_;
};

} // namespace platform
