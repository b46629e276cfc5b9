#pragma once

#include "base/FileDescriptor.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"
#include "keystrand/RequestHandler.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <vector>

namespace keystrand {

/// One client of the kernel service. At most one reply is held: the next request is read only when
/// the reply to the last one is with the client, so a client that does not read holds up nobody
/// but itself.
class KernelConnection {
  public:
    /// Called last of all when the connection has ended; may destroy it.
    using Ended = std::function<void()>;

    /// `packetBuffer` is scratch space for one packet, one byte larger than the largest that is
    /// allowed; connections may share it. Loop, handler and buffer outlive the connection.
    KernelConnection(EventLoop& loop, base::FileDescriptor fd, RequestHandler& handler,
                     std::span<std::uint8_t> packetBuffer, Ended ended);

    /// False when the loop had no room to watch it; such a connection never ends by itself.
    [[nodiscard]] bool isWatched() const { return source_ && delay_; }

  private:
    enum class Alive : bool { no, yes };

    void onReady(std::uint32_t events);
    [[nodiscard]] Alive receive();
    [[nodiscard]] Alive carryOut(RequestOutcome outcome);
    [[nodiscard]] Alive sendReply();
    void dropReply();
    void doAfterwards();
    void endUnless(Alive alive);

    base::FileDescriptor fd_;
    RequestHandler& handler_;
    std::span<std::uint8_t> packetBuffer_;
    Ended ended_;
    ConnectionState state_;
    std::vector<std::uint8_t> reply_;
    std::function<void()> afterwards_;
    EventSource source_;
    EventSource delay_;
};

/// Serves the kernel service's socket to a bounded number of clients.
class KernelSocketServer {
  public:
    static constexpr std::size_t kMaxConnections = 64;

    /// Whether a client that has just connected is served; any other is hung up on.
    using Admits = std::function<bool()>;

    /// Loop and handler outlive the server.
    KernelSocketServer(
        EventLoop& loop, ListeningSocket socket, RequestHandler& handler,
        Admits admits = [] { return true; });

    [[nodiscard]] std::size_t connectionCount() const { return connections_.size(); }

  private:
    using Table = ConnectionTable<KernelConnection>;

    std::unique_ptr<KernelConnection> serve(base::FileDescriptor fd, Table::Ended ended);

    EventLoop& loop_;
    RequestHandler& handler_;
    Admits admits_;
    std::vector<std::uint8_t> packetBuffer_;
    Table connections_;
};

} // namespace keystrand
