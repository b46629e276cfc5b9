#pragma once

#include "keystrand-sim/DispatchTable.h"
#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/Registry.h"
#include "keystrand-sim/RequestLog.h"
#include "wire/KernelSocket.h"

#include <chrono>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

namespace sim {

/// What is remembered of one connection between its requests.
struct ConnectionState {
    bool open = false;
};

/// What the connection is to do after a request.
struct RequestOutcome {
    enum class Kind { reply, silence, hangUp };
    Kind kind = Kind::reply;
    std::vector<std::uint8_t> packet;
    std::chrono::milliseconds delay{0};
};

/// Turns a request packet into a reply packet, faults included. Knows nothing of sockets.
class RequestHandler {
  public:
    /// Each of these outlives the handler.
    struct Parts {
        Registry& registry;
        const DispatchTable& commands;
        const std::uint8_t& logLevel;
        FaultScript& faults;
        RequestLog& log;
    };

    explicit RequestHandler(const Parts& parts) : parts_(parts) {}

    [[nodiscard]] RequestOutcome handle(std::span<const std::uint8_t> packet,
                                        ConnectionState& connection);

  private:
    using Bytes = std::span<const std::uint8_t>;
    struct Reply {
        KernelStatus status = kKernelSuccess;
        std::uint32_t reported = 0;
        std::vector<std::uint8_t> body;
    };

    [[nodiscard]] Reply perform(wire::KernelOperation operation, Bytes body,
                                ConnectionState& connection);
    [[nodiscard]] Reply findByPath(Bytes body) const;
    [[nodiscard]] Reply findByClassName(Bytes body) const;
    [[nodiscard]] Reply copyProperty(Bytes body);
    [[nodiscard]] Reply open(Bytes body, ConnectionState& connection) const;
    [[nodiscard]] Reply structCall(Bytes body, const ConnectionState& connection) const;
    [[nodiscard]] Reply scalarCall(Bytes body, const ConnectionState& connection) const;
    [[nodiscard]] bool isEntry(std::string_view path) const;

    [[nodiscard]] static Reply failed(KernelStatus status);
    [[nodiscard]] static Reply foundEntry(bool found);
    static void replace(Reply& reply, const FaultEffect& effect);
    [[nodiscard]] static RequestOutcome answer(const wire::KernelRequestHeader& request,
                                               const Reply& reply, const FaultEffect& effect);

    Parts parts_;
};

} // namespace sim
