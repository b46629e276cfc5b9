#pragma once

#include "base/FileDescriptor.h"
#include "wire/HTTPMessages.h"

#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <utility>
#include <vector>

namespace wire {

/// How an operation on a connection ended.
enum class HTTPConnectionState {
    open,
    /// The peer has gone, or never was.
    hungUp,
    /// The peer was waited for as long as it may be.
    timedOut,
    /// What ends all waits became readable.
    interrupted,
    /// What came is no message.
    malformed,
};

/// A message as it came; its fields point into the connection until the next one is received.
struct HTTPMessage {
    HTTPMessageType type = HTTPMessageType::request;
    std::span<const std::uint8_t> fields;
};

/// Sends and receives whole messages over a stream socket. After an operation that did not leave it
/// open a connection is of no more use.
class HTTPConnection {
  public:
    using Clock = std::chrono::steady_clock;
    /// How long one message may take in either direction; none is for ever.
    using Patience = std::optional<std::chrono::milliseconds>;

    /// Once the descriptor `interrupt`, which stays the caller's, is readable, nothing is waited
    /// for any more; -1 for none.
    HTTPConnection(base::FileDescriptor socket, Patience patience, int interrupt = -1)
        : socket_(std::move(socket)), patience_(patience), interrupt_(interrupt) {}

    /// From then on nothing is received or waited for any more, however often the peer says
    /// something.
    void endAt(Clock::time_point end) { end_ = end; }

    [[nodiscard]] HTTPConnectionState send(std::span<const std::uint8_t> message);

    /// Sends 1 to kHTTPMaxPieceSize bytes of a body, without a copy.
    [[nodiscard]] HTTPConnectionState sendPiece(std::span<const std::uint8_t> bytes);

    /// Waits for the next message. `message` is as before when it does not come.
    [[nodiscard]] HTTPConnectionState receive(HTTPMessage& message);

    /// Whether the peer has closed its end. What it sent before may still wait to be received.
    [[nodiscard]] bool isHungUp() const;

  private:
    class Deadline;

    [[nodiscard]] HTTPConnectionState
    sendAll(std::initializer_list<std::span<const std::uint8_t>> parts);
    [[nodiscard]] HTTPConnectionState receiveAll(std::span<std::uint8_t> bytes,
                                                 const Deadline& deadline);
    /// Open when the socket is ready for that; not before the deadline otherwise.
    [[nodiscard]] HTTPConnectionState awaitReady(short events, const Deadline& deadline) const;

    base::FileDescriptor socket_;
    Patience patience_;
    std::optional<Clock::time_point> end_;
    int interrupt_;
    std::vector<std::uint8_t> fields_;
};

} // namespace wire
