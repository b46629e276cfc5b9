#include "tests/neighbours/KernelSide.h"

#include "base/ByteReader.h"
#include "base/UnixAddress.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <cstring>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

using Operation = wire::KernelOperation;

constexpr std::size_t kFrameHeaderSize = 8;
constexpr std::uint8_t kKernelControlCommand = 26;
constexpr std::size_t kLargestRequest = wire::kKernelMessageMaxSize;
constexpr std::size_t kDescriptorsAlong = 3;

std::uint32_t readU32(std::span<const std::uint8_t> bytes, std::size_t offset) {
    std::uint32_t value = 0;
    static_cast<void>(base::ByteReader(bytes.subspan(offset)).readU32(value));
    return value;
}

/// How large the output of a command usually is.
std::size_t usualSize(std::uint8_t command) {
    switch (command) {
    case 1:
        return 17;
    case 3:
    case 4:
    case 11:
    case 13:
        return 4;
    case 18:
        return 5;
    case 20:
        return 24;
    case 25:
        return 16;
    default:
        return 0;
    }
}

} // namespace

Bytes wellFormedRecord(Random& random, std::uint32_t type) {
    using namespace wire::rm;
    Bytes record = random.bytes(kNotificationSize);
    put(record, kNotificationTypeOffset, type);
    if (type == kKSTRMNotificationTimerRestarted) {
        // Far away, so that none is due; sometimes none, past, or beyond what a date can be.
        const std::uint64_t alarm = random.oneIn(4)   ? 0
                                    : random.oneIn(8) ? random.number()
                                                      : 7'000'000'000 + random.below(1000);
        put(record, kAlarmTimestampOffset, alarm);
    }
    return record;
}

Bytes anyRecord(Random& random) {
    Bytes record = wellFormedRecord(random, static_cast<std::uint32_t>(1 + random.below(4)));
    switch (random.below(6)) {
    case 0:
        record.resize(random.length(300));
        break;
    case 1:
        put(record, 0, static_cast<std::uint32_t>(random.number()));
        break;
    case 2:
        mutate(random, record);
        break;
    default:
        break;
    }
    return record;
}

KernelSide::KernelSide(std::string path, Acknowledged acknowledged)
    : path_(std::move(path)), acknowledged_(std::move(acknowledged)), packet_(kLargestRequest + 1) {
    appear();
}

void KernelSide::beHostile(Random* ideas, std::size_t silences) {
    ideas_ = ideas;
    silences_ = silences;
    isElusive_ = ideas != nullptr && ideas->oneIn(3);
}

void KernelSide::vanish() {
    ::unlink(path_.c_str());
    listener_.reset();
    connections_.clear();
}

void KernelSide::appear() {
    const auto address = base::UnixAddress::of(path_);
    require(address.has_value(), "too long a path: " + path_);
    ::unlink(path_.c_str());
    listener_ =
        base::FileDescriptor(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    require(::bind(listener_.get(), address->get(), address->size()) == 0 &&
                ::listen(listener_.get(), 64) == 0,
            "cannot listen on " + path_);
}

void KernelSide::addTo(std::vector<pollfd>& watched) const {
    if (listener_.isOpen()) {
        watched.push_back({listener_.get(), POLLIN, 0});
    }
    for (const Connection& connection : connections_) {
        watched.push_back({connection.socket.get(), POLLIN, 0});
    }
}

void KernelSide::serve(const std::vector<pollfd>& watched) {
    const auto isReady = [&watched](int descriptor) {
        return std::any_of(watched.begin(), watched.end(), [descriptor](const pollfd& one) {
            return one.fd == descriptor && one.revents != 0;
        });
    };
    std::erase_if(connections_, [&](Connection& connection) {
        return isReady(connection.socket.get()) && !serve(connection);
    });
    if (listener_.isOpen() && isReady(listener_.get())) {
        accept();
    }
}

void KernelSide::accept() {
    base::FileDescriptor socket(
        ::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (socket.isOpen() && (ideas_ == nullptr || !ideas_->oneIn(100))) {
        connections_.push_back({std::move(socket)});
    }
}

bool KernelSide::serve(Connection& connection) {
    const ssize_t length =
        ::recv(connection.socket.get(), packet_.data(), packet_.size(), MSG_TRUNC);
    if (length < 0) {
        return errno == EAGAIN || errno == EINTR;
    }
    if (length == 0) {
        return false;
    }
    require(static_cast<std::size_t>(length) <= kLargestRequest, "too large a request");
    const std::span<const std::uint8_t> packet(packet_.data(), static_cast<std::size_t>(length));
    const auto header = wire::decodeKernelRequestHeader(packet);
    require(header.has_value(), "a request without a header");
    Request request{*header, packet.subspan(wire::kKernelRequestHeaderSize)};
    check(request, connection.leftover == 0);
    ++exchanges_;
    if (silences_ > 0 && ideas_ != nullptr && ideas_->oneIn(1000)) {
        --silences_;
        given_.erase(request.property);
        return true;
    }
    const Answer answer =
        ideas_ != nullptr ? hostileAnswer(request) : Answer{{properAnswer(request)}};
    note(request, answer, connection.leftover == 0);
    connection.leftover += answer.packets.size();
    connection.leftover -= std::min<std::size_t>(connection.leftover, 1);
    send(connection, answer);
    return !answer.hangsUp;
}

void KernelSide::check(Request& request, bool waits) {
    switch (request.header.operation) {
    case Operation::findByPath:
        require(wire::decodeKernelFindByPath(request.body).has_value(), "a malformed path");
        break;
    case Operation::findByClassName:
        require(wire::decodeKernelFindByClassName(request.body).has_value(), "a malformed class");
        break;
    case Operation::copyProperty: {
        const auto parts = wire::decodeKernelProperty(request.body);
        require(parts.has_value(), "a malformed request for a property");
        request.property = parts->name;
        break;
    }
    case Operation::open:
        require(wire::decodeKernelOpen(request.body).has_value(), "a malformed opening");
        break;
    case Operation::structCall: {
        const auto call = wire::decodeKernelStruct(request.body);
        require(call.has_value(), "a malformed call");
        checkCommand(*call, waits);
        break;
    }
    case Operation::scalarCall:
        require(wire::decodeKernelScalar(request.body).has_value(), "a malformed call of numbers");
        break;
    }
}

void KernelSide::checkCommand(const wire::KernelStructRequest& call, bool waits) {
    using namespace wire::rm;
    require(call.input.size() >= kFrameHeaderSize && std::memcmp(call.input.data(), "DRCS", 4) == 0,
            "a malformed frame");
    const auto payload = call.input.subspan(kFrameHeaderSize);
    if (call.input[4] != kKernelControlCommand || payload.size() < 4 ||
        readU32(payload, 0) != kKSTKernelControlRMNotificationAck) {
        return;
    }
    require(payload.size() == 4 + kNotificationAckPayloadSize, "a malformed acknowledgement");
    const auto* const text = reinterpret_cast<const char*>(payload.data() + 4);
    const std::string name(text, ::strnlen(text, kNotificationAckPayloadSize));
    const auto given = given_.find(name);
    acknowledged_(name, given != given_.end() ? std::optional(given->second) : std::nullopt, waits);
    // Once for each copy.
    given_.erase(name);
}

Bytes KernelSide::reply(const Request& request, std::int32_t status, std::uint32_t reported,
                        std::span<const std::uint8_t> body) const {
    const auto header = wire::encodeKernelReplyHeader(
        {request.header.operation, request.header.sequence, status, reported});
    Bytes packet(header.begin(), header.end());
    append(packet, body);
    return packet;
}

Bytes KernelSide::properAnswer(const Request& request) const {
    Bytes body;
    switch (request.header.operation) {
    case Operation::findByPath:
    case Operation::findByClassName:
        append(body, std::string_view(wire::rm::kKernelServicePath));
        return reply(request, 0, 1, body);
    case Operation::copyProperty: {
        const auto found = properties.find(request.property);
        return found == properties.end() ? reply(request, 0, 0)
                                         : reply(request, 0, 1, found->second);
    }
    case Operation::open:
        return reply(request, 0, 0);
    case Operation::structCall: {
        const std::uint8_t command = wire::decodeKernelStruct(request.body)->input[4];
        body.resize(usualSize(command));
        if (command == 3 || command == 11) {
            body[0] = 1;
        }
        return reply(request, 0, static_cast<std::uint32_t>(body.size()), body);
    }
    case Operation::scalarCall:
        append(body, std::uint64_t{0});
        return reply(request, 0, 1, body);
    }
    return body;
}

/// An answer that keeps the rules of the socket, with contents that nobody would expect.
Bytes KernelSide::hostileContent(const Request& request) {
    Random& random = *ideas_;
    switch (request.header.operation) {
    case Operation::copyProperty:
        return reply(request, 0, 1, anyRecord(random));
    case Operation::findByPath:
    case Operation::findByClassName:
        return reply(request, 0, 1, random.bytes(random.length(1100)));
    case Operation::structCall: {
        if (outputs.empty() || random.oneIn(4)) {
            const Bytes body = random.bytes(random.length(4200));
            return reply(request, 0, static_cast<std::uint32_t>(body.size()), body);
        }
        Bytes body;
        const std::uint8_t command = wire::decodeKernelStruct(request.body)->input[4];
        if (command == 3 || command == 11) {
            append(body, static_cast<std::uint32_t>(random.below(2)));
            append(body, std::span<const std::uint8_t>(outputs[random.below(outputs.size())]));
        } else {
            body = random.bytes(usualSize(command));
        }
        if (random.oneIn(3)) {
            mutate(random, body);
        }
        return reply(request, 0, static_cast<std::uint32_t>(body.size()), body);
    }
    case Operation::open:
    case Operation::scalarCall: {
        Bytes body;
        for (std::size_t count = random.length(18); count > 0; --count) {
            append(body, random.number());
        }
        return reply(request, 0, static_cast<std::uint32_t>(body.size() / 8), body);
    }
    }
    return {};
}

KernelSide::Answer KernelSide::hostileAnswer(const Request& request) {
    Random& random = *ideas_;
    if (isElusive_ && request.header.operation == Operation::open) {
        return {{reply(request, -6004, 0)}};
    }
    if (isElusive_ && request.header.operation == Operation::findByClassName) {
        return {{reply(request, 0, 1, random.bytes(1 + random.below(60)))}};
    }
    Bytes packet = random.oneIn(2) ? properAnswer(request) : hostileContent(request);
    switch (random.below(24)) {
    case 0:
    case 1:
    case 2:
    case 3:
        mutate(random, packet);
        return {{std::move(packet)}};
    case 4: {
        const Bytes body = random.bytes(random.length(64));
        return {{reply(request, static_cast<std::int32_t>(random.number()),
                       static_cast<std::uint32_t>(random.number()), body)}};
    }
    case 5:
        return {{random.bytes(random.length(200))}};
    case 6:
        return {{packet, packet}};
    case 7:
        return {{}, true};
    case 8:
        return {{std::move(packet)}, true};
    case 9:
        return {{std::move(packet)}, false, true};
    case 10:
        if (random.oneIn(8)) {
            packet.resize(wire::kKernelMessageMaxSize + random.below(3) - 1, 0x55);
        }
        return {{std::move(packet)}};
    case 11:
        return {{reply(request, -static_cast<std::int32_t>(random.below(7000)), 0)}};
    default:
        return {{std::move(packet)}};
    }
}

/// What the client takes of an answer, by the rules of the socket.
void KernelSide::note(const Request& request, const Answer& answer, bool isFresh) {
    if (request.header.operation != Operation::copyProperty) {
        return;
    }
    given_.erase(request.property);
    if (!isFresh || answer.packets.empty() ||
        answer.packets.front().size() > wire::kKernelMessageMaxSize) {
        return;
    }
    const Bytes& packet = answer.packets.front();
    const auto header = wire::decodeKernelReplyHeader(packet);
    if (header && header->operation == request.header.operation &&
        header->sequence == request.header.sequence && header->status == 0 &&
        header->reported != 0) {
        given_[request.property] =
            Bytes(packet.begin() + wire::kKernelReplyHeaderSize, packet.end());
    }
}

void KernelSide::send(const Connection& connection, const Answer& answer) const {
    bool takesDescriptors = answer.hasDescriptors;
    for (const Bytes& packet : answer.packets) {
        iovec data{const_cast<std::uint8_t*>(packet.data()), packet.size()};
        alignas(cmsghdr) std::uint8_t control[CMSG_SPACE(kDescriptorsAlong * sizeof(int))]{};
        msghdr message{};
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        if (std::exchange(takesDescriptors, false)) {
            message.msg_control = control;
            message.msg_controllen = sizeof control;
            cmsghdr* const part = CMSG_FIRSTHDR(&message);
            part->cmsg_level = SOL_SOCKET;
            part->cmsg_type = SCM_RIGHTS;
            part->cmsg_len = CMSG_LEN(kDescriptorsAlong * sizeof(int));
            const int descriptors[kDescriptorsAlong] = {STDIN_FILENO, STDIN_FILENO, STDIN_FILENO};
            std::memcpy(CMSG_DATA(part), descriptors, sizeof descriptors);
        }
        ::sendmsg(connection.socket.get(), &message, MSG_NOSIGNAL | MSG_DONTWAIT);
    }
}

} // namespace neighbours
