#include "platform/linux/LinuxKernelChannel.h"

#include "base/Saturate.h"
#include "platform/linux/AsBytes.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

namespace platform {

namespace {

Status sendOpen(KernelSocketConnection& connection, std::uint32_t type, const std::string& path) {
    const auto request = wire::encodeKernelOpen({type, path});
    KernelSocketConnection::Reply reply;
    const Status status = connection.exchangeOnce(wire::KernelOperation::open, {request}, reply);
    return status == kSuccess ? reply.status : status;
}

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

LinuxKernelChannel::LinuxKernelChannel(std::string socketPath, const LinuxServiceRegistry& registry,
                                       SystemLog& log, std::chrono::milliseconds timeout)
    : socketPath_(std::move(socketPath)), registry_(registry), log_(log), timeout_(timeout) {}

KernelSocketConnection* LinuxKernelChannel::find(ConnectionHandle connection) {
    return connection == kNoConnection || connection > connections_.size()
               ? nullptr
               : connections_[connection - 1].get();
}

Status LinuxKernelChannel::open(ServiceHandle service, std::uint32_t connectionType,
                                ConnectionHandle* connection) {
    const std::string path = registry_.pathOf(service);
    if (path.empty()) {
        return statusFromErrno(ENOENT);
    }
    // Sent again on every fresh connection, so that a kernel side that was restarted is open too.
    auto opened = std::make_unique<KernelSocketConnection>(
        socketPath_, log_, timeout_, [connectionType, path](KernelSocketConnection& fresh) {
            return sendOpen(fresh, connectionType, path);
        });
    const Status status = opened->connect();
    if (status == kSuccess) {
        connections_.push_back(std::move(opened));
        *connection = static_cast<ConnectionHandle>(connections_.size());
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
    if (reply.reported > offered) {
        return handOutSize(reply.reported, outputSize);
    }
    if (reply.reported != reply.body.size()) {
        socket->disconnect();
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
    const auto request =
        wire::encodeKernelScalar({selector, offered, {inputs, inputs + inputCount}});
    KernelSocketConnection::Reply reply;
    const Status status = socket->exchange(wire::KernelOperation::scalarCall, {request}, reply);
    if (status != kSuccess || reply.status != kSuccess) {
        return status != kSuccess ? status : reply.status;
    }
    if (reply.reported > offered) {
        return handOutSize(reply.reported, outputCount);
    }
    const auto scalars = wire::decodeKernelScalars(reply.body, reply.reported);
    if (!scalars) {
        socket->disconnect();
        return statusFromErrno(EPROTO);
    }
    std::copy(scalars->begin(), scalars->end(), outputs);
    if (outputCount != nullptr) {
        *outputCount = reply.reported;
    }
    return kSuccess;
}

} // namespace platform
