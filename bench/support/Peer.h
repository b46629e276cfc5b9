#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "wire/KernelSocket.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace bench {

using Bytes = std::vector<std::uint8_t>;

/// A reply as the kernel side sends it, ready but for its sequence.
[[nodiscard]] Bytes preparedReply(wire::KernelOperation operation, std::uint32_t reported,
                                  const Bytes& body);

/// What a peer answers.
struct PeerScript {
    std::map<wire::KernelOperation, Bytes> replies;
    /// Where in the reply to "copy property" a little-endian 64-bit number lies that grows by one
    /// with each such reply.
    std::optional<std::size_t> growingNumber = std::nullopt;
};

/// Replies to find the entry and to open it, on top of which a script puts its own.
[[nodiscard]] PeerScript basicScript();

/// The least that can stand on the other side of the kernel socket: for each connection a process
/// that receives a request, puts its sequence into the reply prepared for its operation, and sends
/// that. Two system calls a round trip. The product and the bare exchange it is compared with talk
/// to the same peer.
///
/// One connection is in use at a time.
class Peer : private base::NotCopied {
  public:
    /// Listens when this returns. Its processes run on the CPUs of this one.
    Peer(const std::string& socketPath, const PeerScript& script);
    ~Peer();

    /// How many struct calls were answered so far.
    [[nodiscard]] std::uint64_t structCalls() const;

    /// The last request, as it came in.
    [[nodiscard]] Bytes lastRequest() const;

    struct Shared;

  private:
    Shared* shared_;
    pid_t listener_ = -1;
};

/// The floor under every exchange with a kernel side: a fixed request sent, its reply received.
class BareExchange {
  public:
    BareExchange(const std::string& socketPath, Bytes request);

    /// One round trip. Throws when it fails.
    void roundTrip();

    [[nodiscard]] std::uint64_t roundTrips() const { return roundTrips_; }
    [[nodiscard]] std::size_t requestSize() const { return request_.size(); }
    /// The size of the last reply.
    [[nodiscard]] std::size_t replySize() const { return replySize_; }

  private:
    base::FileDescriptor socket_;
    Bytes request_;
    Bytes reply_;
    std::size_t replySize_ = 0;
    std::uint64_t roundTrips_ = 0;
};

} // namespace bench
