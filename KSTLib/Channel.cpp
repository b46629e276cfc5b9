#include "KSTLib/Channel.h"

#include "KSTLib/Command.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Platform.h"
#include "common/Allocation.h"
#include "common/PayloadMemory.h"
#include "wire/RestrictedMode.h"

#include <cerrno>
#include <chrono>
#include <cstring>
#include <limits>

namespace kst {

namespace {

constexpr std::uint32_t kConnectionType = 0;

CallState call;

void setDeadline(std::optional<platform::KernelConnections::Deadline> deadline) {
    if (const LibraryPlatform* platform = installedPlatform()) {
        platform->registry.setDeadline(deadline);
        platform->channel.setDeadline(deadline);
    }
}

/// The platform's status for want of memory is the library's.
KSTStatus asLibraryStatus(platform::Status status) {
    return status == platform::statusFromErrno(ENOMEM) ? kKSTErrorOutOfMemory : status;
}

/// Reports what the platform or the kernel side failed with.
KSTStatus failTransport(const LibraryPlatform& platform, platform::Status status,
                        CheckPlace place = CheckPlace::here()) {
    call.connectionLost = !platform.channel.isConnected(gConnection);
    return failCall(libraryContext(), asLibraryStatus(status), place);
}

/// The frame of a command, in `cmd`.
KSTStatus fillFrame(const AllocatedMemory& cmd, std::uint8_t code, std::uint8_t thirdByte,
                    const void* inData, std::size_t inSize) {
    if (cmd.bytes() == nullptr) {
        return fail(libraryContext(), "cmd", 0, kKSTErrorOutOfMemory);
    }
    const KSTStatus err = buildCommand(cmd.bytes(), code, thirdByte);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (inSize > 0) {
        if (inData == nullptr) {
            return fail(libraryContext(), "inData", 0, kKSTErrorBadParameter);
        }
        std::memcpy(cmd.bytes() + kKSTCommandHeaderSize, inData, inSize);
    }
    return kKSTErrorSuccess;
}

/// Steps of `performCommand` once the frame is complete.
KSTStatus sendFrame(const AllocatedMemory& frame, void* outData, std::size_t* outSize) {
    const LibraryPlatform* platform = installedPlatform();
    if (platform == nullptr) {
        return fail(libraryContext(), "service", 0, kKSTErrorUnexpected);
    }
    const std::size_t offeredSize = outSize != nullptr ? *outSize : 0;
    std::size_t replySize = offeredSize;
    const KSTStatus err = platform->channel.structCall(
        gConnection, kKSTSelectorCommand, frame.bytes(), frame.size(), outData, &replySize);
    if (err != kKSTErrorSuccess) {
        return failTransport(*platform, err);
    }
    // The platform tells the size of a reply that did not fit, and nothing else of it.
    if (replySize > offeredSize) {
        call.connectionLost = !platform->channel.isConnected(gConnection);
        return fail(libraryContext(), "replySize <= offeredSize", 0, kKSTErrorUnexpected);
    }
    if (outSize != nullptr) {
        *outSize = replySize;
    }
    return kKSTErrorSuccess;
}

KSTStatus readLogLevel(platform::KernelChannel& channel) {
    std::uint64_t output = 0;
    std::uint32_t outputCount = 1;
    const KSTStatus err =
        channel.scalarCall(gConnection, kKSTSelectorLogLevel, nullptr, 0, &output, &outputCount);
    if (err != kKSTErrorSuccess) {
        return failCall(libraryContext(), err);
    }
    if (outputCount != 1) {
        return fail(libraryContext(), "outputCount == 1", 0, kKSTErrorUnexpected);
    }
    gLogLevel = static_cast<std::uint8_t>(output & 0xffU);
    return kKSTErrorSuccess;
}

} // namespace

bool gChannelOpen = false;
platform::ConnectionHandle gConnection = platform::kNoConnection;

CallScope::CallScope() noexcept : outer_(call) {
    leaveInheritedToParent();
    const LibraryPlatform* platform = installedPlatform();
    call = {};
    if (platform != nullptr) {
        call.deadline = platform->callTime.now() + platform->callTime.limit;
    }
    setDeadline(call.deadline);
}

CallScope::~CallScope() {
    call = outer_;
    setDeadline(call.deadline);
}

bool isTimeUp() noexcept {
    const LibraryPlatform* platform = installedPlatform();
    return platform != nullptr && call.deadline && platform->callTime.now() >= *call.deadline;
}

bool isConnectionLost() noexcept {
    return call.connectionLost;
}

void closeChannel() noexcept {
    gChannelOpen = false;
    gConnection = platform::kNoConnection;
    call = {};
}

KSTStatus init() noexcept {
    leaveInheritedToParent();
    if (gChannelOpen) {
        return kKSTErrorSuccess;
    }
    if (!watchForks()) {
        return fail(libraryContext(), "watchForks()", 0, kKSTErrorOutOfMemory);
    }
    const LibraryPlatform* platform = installedPlatform();
    const platform::ServiceHandle service =
        platform != nullptr ? platform->registry.findByClassName(wire::rm::kKernelServiceClass)
                            : platform::kNoService;
    if (service == platform::kNoService) {
        return fail(libraryContext(), "service", 0, kKSTErrorUnexpected);
    }
    platform::ConnectionHandle connection = platform::kNoConnection;
    const KSTStatus err = platform->channel.open(service, kConnectionType, &connection);
    // The service object is not given back: the next try finds the same one.
    if (err != kKSTErrorSuccess) {
        return failCall(libraryContext(), asLibraryStatus(err));
    }
    platform->registry.release(service);
    gConnection = connection;
    gChannelOpen = true;
    return kKSTErrorSuccess;
}

KSTStatus buildCommand(std::uint8_t* frame, std::uint8_t code, std::uint8_t thirdByte) noexcept {
    if (frame == nullptr) {
        return fail(libraryContext(), "cmd", 0, kKSTErrorBadParameter);
    }
    writeCommandHeader(frame, code, 0, thirdByte);
    return kKSTErrorSuccess;
}

KSTStatus performCommand(std::uint8_t code, std::uint8_t thirdByte, const void* inData,
                         std::size_t inSize, void* outData, std::size_t* outSize) noexcept {
    if (outSize != nullptr && *outSize != 0 && outData == nullptr) {
        return fail(libraryContext(), "outData", 0, kKSTErrorBadParameter);
    }
    // As if there were no memory, which could not even be asked for so much.
    if (inSize > std::numeric_limits<std::size_t>::max() - kKSTCommandHeaderSize) {
        return fail(libraryContext(), "cmd", 0, kKSTErrorOutOfMemory);
    }
    const AllocatedMemory cmd(kKSTCommandHeaderSize + inSize);
    const KSTStatus err = fillFrame(cmd, code, thirdByte, inData, inSize);
    return err == kKSTErrorSuccess ? sendFrame(cmd, outData, outSize) : err;
}

KSTStatus postCommand(std::uint8_t code, const void* inData, std::size_t inSize) noexcept {
    const AllocatedMemory cmd(kKSTCommandHeaderSize + inSize);
    KSTStatus err = fillFrame(cmd, code, 0, inData, inSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const LibraryPlatform* platform = installedPlatform();
    if (platform == nullptr) {
        return fail(libraryContext(), "service", 0, kKSTErrorUnexpected);
    }
    err = platform->channel.post(gConnection, kKSTSelectorCommand, cmd.bytes(), cmd.size());
    return err == kKSTErrorSuccess ? err : failCall(libraryContext(), asLibraryStatus(err));
}

KSTStatus openChannelTransport(void* /*transportContext*/, std::uint32_t code,
                               std::uint32_t thirdByte, const void* inData, std::size_t inSize,
                               void* outData, std::size_t* outSize) noexcept {
    return performCommand(static_cast<std::uint8_t>(code), static_cast<std::uint8_t>(thirdByte),
                          inData, inSize, outData, outSize);
}

KSTStatus channelTransport(void* transportContext, std::uint32_t code, std::uint32_t thirdByte,
                           const void* inData, std::size_t inSize, void* outData,
                           std::size_t* outSize) noexcept {
    const KSTStatus err = init();
    return err == kKSTErrorSuccess ? openChannelTransport(transportContext, code, thirdByte, inData,
                                                          inSize, outData, outSize)
                                   : err;
}

void updateLogLevel() noexcept {
    const LibraryPlatform* platform = installedPlatform();
    if (platform != nullptr && readLogLevel(platform->channel) == kKSTErrorSuccess) {
        logLevelSet(__func__);
    }
    logReturning(__func__);
}

} // namespace kst
