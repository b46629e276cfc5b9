#include "platform/linux/LinuxKernelChannel.h"

#include "base/Saturate.h"
#include "platform/linux/AsBytes.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace platform {

namespace {

constexpr std::size_t kScalarSize = sizeof(std::uint64_t);

/// Tells of a reply that is larger than was offered, and nothing else of it.
template <typename Size>
Status handOutSize(std::size_t reported, Size* size) {
    if (size == nullptr) {
        return statusFromErrno(EMSGSIZE);
    }
    *size = base::saturate<Size>(reported);
    return kSuccess;
}

} // namespace

LinuxKernelChannel::LinuxKernelChannel(std::string_view socketPath,
                                       const LinuxServiceRegistry& registry, SystemLog& log,
                                       std::chrono::milliseconds timeout)
    : address_(base::UnixAddress::of(socketPath)),
      registry_(registry),
      log_(log),
      timeout_(timeout) {}

Status LinuxKernelChannel::Opened::greet() {
    const auto prefix = wire::encodeKernelOpenPrefix(type_);
    Reply reply;
    const Status status =
        exchangeOnce(wire::KernelOperation::open, {prefix, asBytes(path_.text())}, reply);
    return status == kSuccess ? reply.status : status;
}

const LinuxKernelChannel::Opened* LinuxKernelChannel::find(ConnectionHandle connection) const {
    if (connection == kNoConnection || connection > connections_.size()) {
        return nullptr;
    }
    const auto& place = connections_[connection - 1];
    return place && !place->leftToParent ? &*place : nullptr;
}

LinuxKernelChannel::Opened* LinuxKernelChannel::find(ConnectionHandle connection) {
    return const_cast<Opened*>(std::as_const(*this).find(connection));
}

Status LinuxKernelChannel::open(ServiceHandle service, std::uint32_t connectionType,
                                ConnectionHandle* connection) {
    if (const Status status = registry_.statusOf(service); status != kSuccess) {
        return status;
    }
    const auto path = RegistryPath::of(registry_.pathOf(service));
    if (!path) {
        return statusFromErrno(ENOENT);
    }
    // What was left to the parent is nobody's here.
    const auto place = std::find_if(connections_.begin(), connections_.end(),
                                    [](const auto& held) { return !held || held->leftToParent; });
    if (place == connections_.end()) {
        return statusFromErrno(EMFILE);
    }
    Opened& opened =
        place->emplace(address_, log_, timeout_, registry_.program(), connectionType, *path);
    // The call that runs has set its deadline before there was this connection.
    opened.setDeadline(deadline_);
    const Status status = opened.connect();
    if (status == kSuccess) {
        *connection = static_cast<ConnectionHandle>(place - connections_.begin()) + 1;
    } else {
        place->reset();
    }
    return status;
}

Status LinuxKernelChannel::structCall(ConnectionHandle connection, std::uint32_t selector,
                                      const void* input, std::size_t inputSize, void* output,
                                      std::size_t* outputSize) {
    KernelSocketConnection* const socket = find(connection);
    if (socket == nullptr) {
        return statusFromErrno(EBADF);
    }
    const std::size_t offered = outputSize == nullptr ? 0 : *outputSize;
    if (offered > 0 && output == nullptr) {
        return statusFromErrno(EINVAL);
    }
    const auto prefix =
        wire::encodeKernelStructPrefix(selector, base::saturate<std::uint32_t>(offered));
    KernelSocketConnection::Reply reply;
    const Status status = socket->exchange(wire::KernelOperation::structCall,
                                           {prefix, asBytes(input, inputSize)}, reply);
    if (status != kSuccess || reply.status != kSuccess) {
        return status != kSuccess ? status : reply.status;
    }
    // Whose bytes are not as many as it says may be out of step: nothing more is asked of it.
    const bool saysItsSize = reply.reported == reply.body.size();
    if (!saysItsSize) {
        socket->disconnect();
    }
    if (reply.reported > offered) {
        return handOutSize(reply.reported, outputSize);
    }
    if (!saysItsSize) {
        return statusFromErrno(EPROTO);
    }
    if (!reply.body.empty()) {
        std::memcpy(output, reply.body.data(), reply.body.size());
    }
    if (outputSize != nullptr) {
        *outputSize = reply.reported;
    }
    return kSuccess;
}

Status LinuxKernelChannel::scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                      const std::uint64_t* inputs, std::uint32_t inputCount,
                                      std::uint64_t* outputs, std::uint32_t* outputCount) {
    KernelSocketConnection* const socket = find(connection);
    if (socket == nullptr) {
        return statusFromErrno(EBADF);
    }
    const std::uint32_t offered = outputCount == nullptr ? 0 : *outputCount;
    if (inputCount > wire::kKernelMaxScalars || offered > wire::kKernelMaxScalars) {
        return statusFromErrno(E2BIG);
    }
    const auto prefix = wire::encodeKernelScalarPrefix(selector, offered, inputCount);
    const auto scalars = wire::encodeKernelScalars({inputs, inputCount});
    KernelSocketConnection::Reply reply;
    const Status status =
        socket->exchange(wire::KernelOperation::scalarCall,
                         {prefix, std::span(scalars).first(inputCount * kScalarSize)}, reply);
    if (status != kSuccess || reply.status != kSuccess) {
        return status != kSuccess ? status : reply.status;
    }
    const bool saysItsCount =
        reply.body.size() / kScalarSize == reply.reported && reply.body.size() % kScalarSize == 0;
    if (!saysItsCount) {
        socket->disconnect();
    }
    if (reply.reported > offered) {
        return handOutSize(reply.reported, outputCount);
    }
    if (!saysItsCount) {
        return statusFromErrno(EPROTO);
    }
    static_cast<void>(wire::decodeKernelScalars(reply.body, {outputs, reply.reported}));
    if (outputCount != nullptr) {
        *outputCount = reply.reported;
    }
    return kSuccess;
}

Status LinuxKernelChannel::post(ConnectionHandle connection, std::uint32_t selector,
                                const void* input, std::size_t inputSize) {
    KernelSocketConnection* const socket = find(connection);
    if (socket == nullptr) {
        return statusFromErrno(EBADF);
    }
    const auto prefix = wire::encodeKernelStructPrefix(selector, 0);
    return socket->post(wire::KernelOperation::structCall, {prefix, asBytes(input, inputSize)});
}

bool LinuxKernelChannel::isConnected(ConnectionHandle connection) const {
    const KernelSocketConnection* const socket = find(connection);
    return socket != nullptr && socket->isConnected();
}

void LinuxKernelChannel::setDeadline(std::optional<Deadline> deadline) noexcept {
    deadline_ = deadline;
    for (auto& place : connections_) {
        if (place) {
            place->setDeadline(deadline);
        }
    }
}

bool LinuxKernelChannel::isInherited() const noexcept {
    return std::any_of(connections_.begin(), connections_.end(),
                       [](const auto& place) { return place && place->isInherited(); });
}

void LinuxKernelChannel::leaveToParent() noexcept {
    for (auto& place : connections_) {
        if (place) {
            place->leaveToParent();
            place->leftToParent = true;
        }
    }
}

} // namespace platform
