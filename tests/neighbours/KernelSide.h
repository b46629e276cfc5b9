#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/neighbours/Random.h"
#include "wire/KernelSocket.h"

#include <functional>
#include <map>
#include <optional>
#include <poll.h>
#include <string>
#include <vector>

namespace neighbours {

/// A kernel side that answers everything as it should, or, with a source of ideas, as it likes. It
/// is served by whoever owns it, and knows exactly what its clients have got from it. A request
/// that is not well-formed is a fault.
class KernelSide : private base::NotCopied {
  public:
    /// The client has acknowledged a property. `record` is what it was given of it last; none when
    /// it was given nothing that it could have taken. `waits` says whether it waits for the answer;
    /// one that was said too much goes on at once.
    using Acknowledged = std::function<void(const std::string& property,
                                            const std::optional<Bytes>& record, bool waits)>;

    KernelSide(std::string path, Acknowledged acknowledged);

    /// Hostile from here on, until it is null. `silences` are how many requests may go without an
    /// answer, each of which the client waits for.
    void beHostile(Random* ideas, std::size_t silences = 0);

    /// Hangs up on everybody, and is not there.
    void vanish();
    void appear();

    void addTo(std::vector<pollfd>& watched) const;
    /// Serves whoever of those wants something.
    void serve(const std::vector<pollfd>& watched);

    /// Requests that were answered, one way or the other.
    [[nodiscard]] std::uint64_t exchanges() const { return exchanges_; }

    /// What the entry has.
    std::map<std::string, Bytes> properties;
    /// What a hostile one may use for the outputs of commands.
    std::vector<Bytes> outputs;

  private:
    struct Connection {
        base::FileDescriptor socket;
        /// Answers that nobody asked for.
        std::size_t leftover = 0;
    };
    struct Request {
        wire::KernelRequestHeader header;
        std::span<const std::uint8_t> body;
        std::string property = {};
    };
    struct Answer {
        std::vector<Bytes> packets;
        bool hangsUp = false;
        bool hasDescriptors = false;
    };

    void accept();
    /// False when the connection is over.
    [[nodiscard]] bool serve(Connection& connection);
    void check(Request& request, bool waits);
    void checkCommand(const wire::KernelStructRequest& call, bool waits);
    [[nodiscard]] Bytes properAnswer(const Request& request) const;
    [[nodiscard]] Answer hostileAnswer(const Request& request);
    [[nodiscard]] Bytes hostileContent(const Request& request);
    [[nodiscard]] Bytes reply(const Request& request, std::int32_t status, std::uint32_t reported,
                              std::span<const std::uint8_t> body = {}) const;
    void note(const Request& request, const Answer& answer, bool isFresh);
    void send(const Connection& connection, const Answer& answer) const;

    std::string path_;
    Acknowledged acknowledged_;
    base::FileDescriptor listener_;
    std::vector<Connection> connections_;
    Random* ideas_ = nullptr;
    std::size_t silences_ = 0;
    /// It is somewhere else whenever somebody looks for it, and opens to nobody.
    bool isElusive_ = false;
    std::uint64_t exchanges_ = 0;
    std::map<std::string, Bytes> given_;
    Bytes packet_;
};

/// A record of that type with any contents, or one that is no record.
[[nodiscard]] Bytes anyRecord(Random& random);
/// A well-formed record of one of the four types.
[[nodiscard]] Bytes wellFormedRecord(Random& random, std::uint32_t type);

} // namespace neighbours
