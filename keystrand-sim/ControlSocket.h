#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-sim/ControlCommand.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

namespace keystrand::sim {

/// One client of the control socket: lines in, answers out, one after the other. While an answer is
/// due or has not been read by the client, nothing more is read from it.
class ControlConnection {
  public:
    static constexpr std::size_t kMaxLineLength = 8192;

    struct Handlers {
        std::function<ControlOutcome(std::string_view line)> run;
        std::function<bool(const WaitCondition&)> isMet;
        std::function<void()> quit;
        /// Called last of all when the connection has ended; may destroy it.
        std::function<void()> ended;
    };

    /// The loop outlives the connection.
    ControlConnection(EventLoop& loop, base::FileDescriptor fd, Handlers handlers);

    /// False when the loop had no room to watch it; such a connection never ends by itself.
    [[nodiscard]] bool isWatched() const { return source_ && timeout_; }

    /// Looks again whether what the client waits for has come. May end the connection.
    void checkWait();

  private:
    void onReady(std::uint32_t events);
    void onTimeout();
    void finishWait(const ControlOutcome& outcome);
    [[nodiscard]] bool receive();
    /// Carries out lines and sends answers as far as possible. False when the connection is over.
    [[nodiscard]] bool proceed();
    [[nodiscard]] bool runNextLine();
    void runLine(std::string_view line);
    void answer(const ControlOutcome& outcome);
    [[nodiscard]] bool sendOutput();
    void endUnless(bool alive) const;

    base::FileDescriptor fd_;
    Handlers handlers_;
    std::string input_;
    std::string output_;
    std::size_t outputSent_ = 0;
    std::optional<WaitCondition> wait_;
    bool inputEnded_ = false;
    EventSource source_;
    EventSource timeout_;
};

/// Serves the control socket to a bounded number of clients.
class ControlSocket {
  public:
    static constexpr std::size_t kMaxConnections = 16;

    /// The loop and all that the context refers to outlive it. Observes the request log.
    ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context);

  private:
    using Table = ConnectionTable<ControlConnection>;

    std::unique_ptr<ControlConnection> serve(base::FileDescriptor fd, Table::Ended ended);

    EventLoop& loop_;
    ControlContext context_;
    Table connections_;
};

} // namespace keystrand::sim
