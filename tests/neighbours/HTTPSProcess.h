#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/neighbours/Random.h"
#include "wire/HTTPMessages.h"

#include <cstdint>
#include <deque>
#include <poll.h>
#include <string>
#include <vector>

namespace neighbours {

/// Whoever listens where the daemon looks for its HTTPS client: accepts every document, or, with a
/// source of ideas, says what it likes. A message of the daemon that is not well-formed is a fault.
class HTTPSProcess : private base::NotCopied {
  public:
    explicit HTTPSProcess(const std::string& path);

    /// Hostile from here on, until it is null. `silences` are how many requests it may leave to the
    /// daemon's patience.
    void beHostile(Random* ideas, std::size_t silences = 0);
    /// Whether the next bags may tell the daemon to drop events.
    void mayPoison(bool may) { mayPoison_ = may; }

    void addTo(std::vector<pollfd>& watched) const;
    void serve(const std::vector<pollfd>& watched);

    /// Messages that it has said.
    [[nodiscard]] std::uint64_t exchanges() const { return exchanges_; }
    /// Documents that were certainly accepted.
    [[nodiscard]] std::uint64_t accepted() const { return accepted_; }
    /// Events in all documents that it was given, the summaries not counted.
    [[nodiscard]] std::uint64_t events() const { return events_; }
    /// Requests with a document in whose course it said something that may have been taken for
    /// acceptance.
    [[nodiscard]] std::uint64_t unclear() const { return unclear_; }

  private:
    struct Step {
        Bytes message;
        /// Whether nothing more is said before the daemon has answered.
        bool isQuestion = false;
    };
    struct Connection {
        base::FileDescriptor socket;
        Bytes input = {};
        /// The end of the document so far, in which a name may have begun.
        std::string tail = {};
        Bytes output = {};
        std::deque<Step> steps = {};
        std::uint64_t bodyLeft = 0;
        bool hasRequest = false;
        bool asksForBody = false;
        bool awaitsAnswer = false;
        /// Hangs up when everything is said.
        bool hangsUp = false;
        bool isSlow = false;
    };

    void accept();
    [[nodiscard]] bool serve(Connection& connection, short events);
    /// False when the daemon has hung up.
    [[nodiscard]] bool receive(Connection& connection);
    void takeMessages(Connection& connection);
    void begin(Connection& connection, const wire::HTTPRequestFields& request);
    void planAcceptance(Connection& connection, const wire::HTTPRequestFields& request);
    void planHostility(Connection& connection, const wire::HTTPRequestFields& request);
    [[nodiscard]] Bytes anyMessage(const wire::HTTPRequestFields& request);
    void appendAnswer(std::deque<Step>& steps, const wire::HTTPRequestFields& request);
    [[nodiscard]] std::string bag();
    void countEvents(Connection& connection, std::span<const std::uint8_t> piece);
    void advance(Connection& connection);
    [[nodiscard]] bool flush(Connection& connection);

    base::FileDescriptor listener_;
    std::vector<Connection> connections_;
    Random* ideas_ = nullptr;
    std::size_t silences_ = 0;
    bool mayPoison_ = false;
    std::uint64_t exchanges_ = 0;
    std::uint64_t accepted_ = 0;
    std::uint64_t unclear_ = 0;
    std::uint64_t events_ = 0;
};

} // namespace neighbours
