#pragma once

#include "platform/KernelConnections.h"
#include "platform/ServiceRegistry.h"

#include <cstddef>
#include <cstdint>

namespace platform {

/// Names an open connection to a kernel service in this process. 0 is no connection.
using ConnectionHandle = std::uint32_t;
inline constexpr ConnectionHandle kNoConnection = 0;

/// Connections to kernel services and the calls on them.
///
/// Called on one thread at a time. Calls are synchronous and bounded in time: a kernel side that
/// does not answer gives the status of ETIMEDOUT. A kernel side that hangs up, answers with the
/// wrong sequence or malformed gives a platform status; its reply is dropped whole, and the next
/// call works on a fresh connection. A request that was handed over is never sent a second time.
///
/// A status of the kernel side is passed on unchanged. On any status but 0 the output and its size
/// are left as they were.
class KernelChannel : public KernelConnections {
  public:
    /// Opens a connection of the given type and stores its handle. `service` stays the caller's.
    /// There is no close: a connection lasts as long as the channel, or until it is left to the
    /// parent.
    [[nodiscard]] virtual Status open(ServiceHandle service, std::uint32_t connectionType,
                                      ConnectionHandle* connection) = 0;

    /// Sends `inputSize` bytes to `selector` and stores the reply in `output`, at most
    /// `*outputSize` bytes (0 when `outputSize` is null). On success `*outputSize` becomes the size
    /// that the kernel side reported. When that is above the offered one, nothing is stored and the
    /// reply is the caller's to refuse; without `outputSize` it gives the status of EMSGSIZE, as
    /// does an input beyond what the channel can carry. A size offered without an `output` gives
    /// the status of EINVAL, and nothing is sent.
    [[nodiscard]] virtual Status structCall(ConnectionHandle connection, std::uint32_t selector,
                                            const void* input, std::size_t inputSize, void* output,
                                            std::size_t* outputSize) = 0;

    /// Sends `inputCount` numbers and stores at most `*outputCount` numbers of the reply, whose
    /// count becomes `*outputCount`. A count above the offered one is treated as such a size is.
    [[nodiscard]] virtual Status scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                            const std::uint64_t* inputs, std::uint32_t inputCount,
                                            std::uint64_t* outputs, std::uint32_t* outputCount) = 0;

    /// Sends as `structCall` does, but waits for nothing, whatever the deadline is: neither until
    /// the request can be sent nor for its answer, which nobody sees. 0 when it was sent.
    [[nodiscard]] virtual Status post(ConnectionHandle connection, std::uint32_t selector,
                                      const void* input, std::size_t inputSize) {
        return structCall(connection, selector, input, inputSize, nullptr, nullptr);
    }

    /// Whether the connection stands as far as is known. One that was lost is made anew by the next
    /// call on it.
    [[nodiscard]] virtual bool isConnected(ConnectionHandle /*connection*/) const { return true; }
};

} // namespace platform
