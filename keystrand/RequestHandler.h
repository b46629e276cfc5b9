#pragma once

#include "base/NotCopied.h"
#include "keystrand/DispatchTable.h"
#include "keystrand/Registry.h"
#include "wire/KernelSocket.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace keystrand {

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
    /// To be called once, when the packet is sent or will never be; null for nothing.
    std::function<void()> afterwards = nullptr;
};

/// Turns a request packet into a reply packet. Knows nothing of sockets.
class RequestHandler : private base::NotCopied {
  public:
    /// Each of these outlives the handler.
    struct Parts {
        Registry& registry;
        const DispatchTable& commands;
        const std::uint8_t& logLevel;
    };

    explicit RequestHandler(const Parts& parts) : parts_(parts) {}
    virtual ~RequestHandler() = default;

    [[nodiscard]] virtual RequestOutcome handle(std::span<const std::uint8_t> packet,
                                                ConnectionState& connection);

  protected:
    using Bytes = std::span<const std::uint8_t>;
    struct Reply {
        KernelStatus status = kKernelSuccess;
        std::uint32_t reported = 0;
        std::vector<std::uint8_t> body;
        std::function<void()> afterwards = nullptr;
    };

    /// The header of a packet that is a request; none for one whose sender is to be hung up on.
    [[nodiscard]] static std::optional<wire::KernelRequestHeader> headerOf(Bytes packet);
    [[nodiscard]] Reply perform(wire::KernelOperation operation, Bytes body,
                                ConnectionState& connection);
    [[nodiscard]] static Reply failed(KernelStatus status);
    [[nodiscard]] static RequestOutcome answerWith(const wire::KernelReplyHeader& header,
                                                   Bytes body);

    /// What a kernel side may do without: the registry entry, and a property when it is asked for.
    [[nodiscard]] virtual bool hasEntry() const { return true; }
    [[nodiscard]] virtual bool hidesProperty(std::string_view /*name*/) { return false; }

  private:
    [[nodiscard]] Reply findByPath(Bytes body) const;
    [[nodiscard]] Reply findByClassName(Bytes body) const;
    [[nodiscard]] Reply copyProperty(Bytes body);
    [[nodiscard]] Reply open(Bytes body, ConnectionState& connection) const;
    [[nodiscard]] Reply structCall(Bytes body, const ConnectionState& connection) const;
    [[nodiscard]] Reply scalarCall(Bytes body, const ConnectionState& connection) const;
    [[nodiscard]] bool isEntry(std::string_view path) const;

    [[nodiscard]] static Reply foundEntry(bool found);

    Parts parts_;
};

} // namespace keystrand
