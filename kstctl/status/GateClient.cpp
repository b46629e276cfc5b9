#include "kstctl/status/GateClient.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "kstctl/ExitStatus.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <optional>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace kstctl {

namespace {

constexpr std::array<GateRule, 11> kRules = {{
    {"attached", "attached before the gate closed"},
    {"returned", "attached when the machine went off"},
    {"hard-wired", "on a port inside the machine"},
    {"keyboard", "the keyboard to unlock with"},
    {"probe", "a hub, tried for a keyboard behind it"},
    {"keyboard-hub", "a hub with the keyboard behind it"},
    {"in-use", "in use"},
    {"administrator", "accepted by an administrator"},
    {"let-in-by-others", "accepted by another program"},
    {"refused", "came while the gate was closed"},
    {"refused-by-others", "refused by another program"},
}};

platform::Error gateSocketError(const std::string& path, int error) {
    switch (error) {
    case ENOENT:
    case ENOTDIR:
        return failure(ExitStatus::missing,
                       base::concat("there is no gate socket at ", path,
                                    "; keystrand is not installed, or does not run"));
    case ECONNREFUSED:
        return failure(ExitStatus::missing,
                       base::concat("nobody listens at ", path, "; keystrand does not run"));
    case EPROTOTYPE:
    case ENOTSOCK:
        return failure(ExitStatus::malformed, base::concat(path, " is no gate socket"));
    case EAGAIN:
        return failure(ExitStatus::failed, base::concat("too many wait at ", path, " already"));
    default:
        return fileError(path, error);
    }
}

platform::Error hungUp() {
    return failure(ExitStatus::failed, "keystrand has hung up without an answer");
}

} // namespace

bool isGateThere(const platform::Paths& paths) {
    return ::access(paths.under(wire::kGateSocket).c_str(), F_OK) == 0 ||
           (errno != ENOENT && errno != ENOTDIR);
}

platform::Result<GateClient> GateClient::connect(const platform::Paths& paths,
                                                 std::chrono::milliseconds patience) {
    const std::string path = paths.under(wire::kGateSocket);
    // Of any file `connect` says that nobody listens.
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        return gateSocketError(path, errno);
    }
    if (!S_ISSOCK(status.st_mode)) {
        return gateSocketError(path, ENOTSOCK);
    }
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        return failure(ExitStatus::failed, base::concat(path, ": too long for a socket"));
    }
    // It does not wait for room in the listener's queue, either.
    base::FileDescriptor connection(
        ::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!connection.isOpen() || ::connect(connection.get(), address->get(), address->size()) != 0) {
        return gateSocketError(path, errno);
    }
    return GateClient(std::move(connection), patience);
}

bool GateClient::awaitAnswer() const {
    using SteadyClock = std::chrono::steady_clock;
    const SteadyClock::time_point deadline = SteadyClock::now() + patience_;
    for (;;) {
        const auto left =
            std::chrono::ceil<std::chrono::milliseconds>(deadline - SteadyClock::now());
        pollfd watched{connection_.get(), POLLIN, 0};
        const int ready =
            ::poll(&watched, 1, static_cast<int>(std::max<std::int64_t>(left.count(), 0)));
        if (ready >= 0 || errno != EINTR) {
            return ready > 0;
        }
    }
}

platform::Result<wire::GateAnswer> GateClient::ask(const wire::GateRequest& request) {
    const std::string question = wire::encodeGateRequest(request);
    if (::send(connection_.get(), question.data(), question.size(), MSG_NOSIGNAL) < 0) {
        return hungUp();
    }
    if (!awaitAnswer()) {
        return failure(ExitStatus::failed, "keystrand does not answer");
    }
    // With room for one byte too many, which is then no answer.
    std::string packet(wire::kGateAnswerSize + 1, '\0');
    const ssize_t size = ::recv(connection_.get(), packet.data(), packet.size(), 0);
    if (size <= 0) {
        return hungUp();
    }
    packet.resize(static_cast<std::size_t>(size));
    auto answer = wire::decodeGateAnswer(packet);
    if (!answer) {
        return failure(ExitStatus::malformed, "keystrand's answer cannot be understood");
    }
    if (const auto* const refusal = std::get_if<wire::GateRefusal>(&*answer)) {
        return failure(ExitStatus::failed, base::concat("keystrand: ", refusal->reason));
    }
    return std::move(*answer);
}

template <typename Answer>
platform::Result<Answer> GateClient::askFor(const wire::GateRequest& request) {
    auto answer = ask(request);
    if (!answer) {
        return answer.error();
    }
    const auto* const wanted = std::get_if<Answer>(&answer.value());
    return wanted != nullptr ? platform::Result<Answer>(*wanted)
                             : failure(ExitStatus::malformed,
                                       "keystrand has answered something else than was asked for");
}

platform::Result<wire::GateDevices> GateClient::devices() {
    return askFor<wire::GateDevices>(wire::GateDevicesRequest());
}

platform::Result<wire::GateStatus> GateClient::status() {
    return askFor<wire::GateStatus>(wire::GateStatusRequest());
}

platform::Result<wire::GateDone> GateClient::order(const wire::GateRequest& request) {
    return askFor<wire::GateDone>(request);
}

std::span<const GateRule> gateRules() {
    return kRules;
}

std::string_view meaningOfGateRule(std::string_view word) {
    const auto* const found = std::find_if(kRules.begin(), kRules.end(),
                                           [&](const GateRule& rule) { return rule.word == word; });
    return found != kRules.end() ? found->meaning : std::string_view();
}

std::string sinceText(const wire::GateDevice& device, platform::Date now) {
    const std::int64_t seconds = now.nanosecondsSince1970 / platform::kNanosecondsPerSecond;
    return device.rule.empty() ? std::string()
                               : timeText(static_cast<std::uint64_t>(seconds) - device.forSeconds);
}

std::string idText(const wire::GateDevice& device) {
    const auto digits = [](std::uint16_t number) {
        const std::array<std::uint8_t, 2> bytes = {static_cast<std::uint8_t>(number >> 8U),
                                                   static_cast<std::uint8_t>(number & 0xffU)};
        return hexText(bytes);
    };
    return base::concat(digits(device.vendor), ':', digits(device.product));
}

Report deviceIdentity(const wire::GateDevice& device) {
    return Report()
        .add("port", device.port)
        .add("number", device.number)
        .add("inode", device.inode)
        .add("id", idText(device))
        .add("manufacturer", device.manufacturer)
        .add("name", device.name)
        .add("serial", device.serial)
        .add("classes", device.classes);
}

Report deviceReport(const wire::GateDevice& device, platform::Date now) {
    Report report = deviceIdentity(device);
    report.add("isAccepted", device.accepted);
    if (device.rule.empty()) {
        report.add("rule", Report::None()).add("since", Report::None());
    } else {
        report.add("rule", device.rule, std::string(meaningOfGateRule(device.rule)))
            .add("since", sinceText(device, now));
    }
    return report;
}

} // namespace kstctl
