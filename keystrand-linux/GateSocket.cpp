#include "keystrand-linux/GateSocket.h"

#include "base/Concat.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace keystrand::usb {

namespace {

template <typename Period>
std::uint64_t secondsOf(std::chrono::duration<std::int64_t, Period> time) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(time).count();
    return static_cast<std::uint64_t>(std::max<std::int64_t>(seconds, 0));
}

wire::GateDevice describe(const UsbGate::Listed& listed, BootTime now) {
    const UsbDevice& device = listed.device;
    return {.port = device.port(),
            .number = device.attachment.number,
            .inode = device.attachment.inode,
            .vendor = device.vendor,
            .product = device.product,
            .manufacturer = device.manufacturer,
            .name = device.name,
            .serial = device.serial,
            .classes = classesOf(device.functions, ','),
            .accepted = device.authorized,
            .rule = std::string(listed.standing ? nameOf(*listed.standing) : ""),
            .forSeconds = listed.standing ? secondsOf(now - listed.since) : 0};
}

wire::GateAnswer devices(Keystrand& keystrand, const MachineClock& clock) {
    wire::GateDevices devices;
    for (const UsbGate::Listed& listed : keystrand.gate().list()) {
        devices.push_back(describe(listed, clock.sinceStart()));
    }
    return devices;
}

/// What is open or closed against all that holds.
std::string gapOf(Keystrand& keystrand, const Keystrand::Status& status) {
    const std::string lost = keystrand.gate().closedByNobodyKnows();
    return lost.empty() ? status.gap
                        : base::concat(status.gap, status.gap.empty() ? "" : ", ", lost,
                                       " (who closed it is not known any more: keystrand --restore "
                                       "--all opens it)");
}

wire::GateAnswer status(Keystrand& keystrand) {
    const Keystrand::Status status = keystrand.status();
    return wire::GateStatus{
        .locked = status.locked,
        .starting = status.starting,
        .sleeping = status.sleeping,
        .restricted = status.restricted,
        .closed = status.closed,
        .allowed = status.policy.allowed,
        .passwordSet = status.policy.passcodeSet,
        .bootArgument = status.policy.bootArg,
        .untilRestricted = status.untilRestricted
                               ? std::optional(secondsOf(*status.untilRestricted))
                               : std::nullopt,
        .untilClosed =
            status.untilClosed ? std::optional(secondsOf(*status.untilClosed)) : std::nullopt,
        .refused = static_cast<std::uint32_t>(keystrand.gate().countRefused()),
        .gap = gapOf(keystrand, status)};
}

} // namespace

wire::GateAnswer answer(Keystrand& keystrand, MachineClock& clock,
                        const wire::GateRequest& request) {
    if (const auto* const accept = std::get_if<wire::GateAcceptRequest>(&request)) {
        const auto reason = keystrand.gate().accept(
            {.port = accept->port, .number = accept->number, .inode = accept->inode});
        return reason ? wire::GateAnswer(wire::GateRefusal{*reason}) : wire::GateDone();
    }
    if (const auto* const open = std::get_if<wire::GateOpenRequest>(&request)) {
        keystrand.openFor(std::chrono::seconds(open->seconds));
        return wire::GateDone();
    }
    return std::holds_alternative<wire::GateStatusRequest>(request) ? status(keystrand)
                                                                    : devices(keystrand, clock);
}

GateConnection::GateConnection(EventLoop& loop, base::FileDescriptor fd, const Answer& answer,
                               Ended ended)
    : fd_(std::move(fd)),
      answer_(answer),
      ended_(std::move(ended)),
      source_(loop.watch(fd_.get(), EPOLLIN, [this](std::uint32_t) { receive(); })) {}

void GateConnection::receive() {
    std::array<char, wire::kGateRequestSize + 1> packet{};
    const ssize_t size = ::recv(fd_.get(), packet.data(), packet.size(), 0);
    if (size < 0 && (errno == EAGAIN || errno == EINTR)) {
        return;
    }
    if (size > 0) {
        const std::string text = answer_({packet.data(), static_cast<std::size_t>(size)});
        if (::send(fd_.get(), text.data(), text.size(), MSG_NOSIGNAL | MSG_DONTWAIT) >= 0) {
            return;
        }
    }
    // Gone, or it does not take its answers.
    const Ended ended = std::move(ended_);
    ended();
}

GateSocket::GateSocket(EventLoop& loop, ListeningSocket socket, Keystrand& keystrand,
                       MachineClock& clock)
    : answer_([&keystrand, &clock](std::string_view packet) {
          const auto request = wire::decodeGateRequest(packet);
          return wire::encodeGateAnswer(request ? answer(keystrand, clock, *request)
                                                : wire::GateRefusal{"not understood"});
      }),
      connections_(loop, std::move(socket), kMostConnections,
                   [this, &loop](base::FileDescriptor fd, GateConnection::Ended ended) {
                       return std::make_unique<GateConnection>(loop, std::move(fd), answer_,
                                                               std::move(ended));
                   }) {}

} // namespace keystrand::usb
