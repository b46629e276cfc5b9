#pragma once

#include "KSTLib/Status.h"
#include "base/NotCopied.h"
#include "platform/KernelChannel.h"

#include <cstddef>
#include <cstdint>
#include <optional>

/// The library's connection to the kernel service and the commands on it. Opened once, never
/// closed; a child of the process has none at first. Not synchronised.
namespace kst {

extern bool gChannelOpen;
extern platform::ConnectionHandle gConnection;

/// What all that is sent from now on has in common.
struct CallState {
    std::optional<platform::KernelConnections::Deadline> deadline;
    /// A command failed and the connection is gone.
    bool connectionLost = false;
};

/// One call of an exported function: whatever it sends has one time limit, LibraryPlatform's
/// `callTime`. A call that a result block makes has its own.
class CallScope : private base::NotCopied {
  public:
    CallScope() noexcept;
    ~CallScope();

  private:
    CallState outer_;
};

/// Of the call under way.
[[nodiscard]] bool isTimeUp() noexcept;
[[nodiscard]] bool isConnectionLost() noexcept;

/// Lets the library be without a connection, outside of any call; the log level stays.
void closeChannel() noexcept;

/// Opens the channel unless it is open. kKSTErrorUnexpected: there is no kernel service, or no
/// platform. kKSTErrorOutOfMemory: no memory for the connection. Any other status is the
/// platform's; the channel stays closed then, and the service object is not given back.
[[nodiscard]] KSTStatus init() noexcept;

/// Writes bytes 0 to 6 of a frame that has room for at least 8: second byte 0, byte 7 left alone.
/// kKSTErrorBadParameter: `frame` is null.
[[nodiscard]] KSTStatus buildCommand(std::uint8_t* frame, std::uint8_t code,
                                     std::uint8_t thirdByte) noexcept;

/// Frames `inSize` bytes at `inData` as a command and sends it over the channel, which must be
/// open. Up to `*outSize` bytes of reply (0 when `outSize` is null) go to `outData`; on success
/// `*outSize` becomes the reply's size. On failure `*outSize` is as it was.
///
/// kKSTErrorBadParameter: a reply size without `outData`, or an input size without `inData`.
/// kKSTErrorOutOfMemory: no memory for the frame. kKSTErrorUnexpected: a reply size above the one
/// offered, or no platform. Any other status is the platform's or the kernel side's.
[[nodiscard]] KSTStatus performCommand(std::uint8_t code, std::uint8_t thirdByte,
                                       const void* inData, std::size_t inSize, void* outData,
                                       std::size_t* outSize) noexcept;

/// `performCommand` that waits for nothing: neither until the frame can be sent nor for the reply,
/// which nobody sees. The connection ends with it. kKSTErrorSuccess: it was sent.
[[nodiscard]] KSTStatus postCommand(std::uint8_t code, const void* inData,
                                    std::size_t inSize) noexcept;

/// The library's own KSTTransport: `init`, then `performCommand`. The context is not looked at; of
/// `code` and `thirdByte` the low byte is sent.
KSTStatus channelTransport(void* transportContext, std::uint32_t code, std::uint32_t thirdByte,
                           const void* inData, std::size_t inSize, void* outData,
                           std::size_t* outSize) noexcept;

/// `channelTransport` for a call that has opened the channel itself.
KSTStatus openChannelTransport(void* transportContext, std::uint32_t code, std::uint32_t thirdByte,
                               const void* inData, std::size_t inSize, void* outData,
                               std::size_t* outSize) noexcept;

/// Asks the kernel service for the library's log level and takes it over; the level stays when that
/// fails. Does not open the channel.
void updateLogLevel() noexcept;

} // namespace kst
