#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/neighbours/Random.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <thread>

namespace neighbours {

/// A message of the bus, as far as is needed here.
struct BusMessage {
    enum class Kind : std::uint8_t { call = 1, reply = 2, error = 3, signal = 4 };

    Kind kind = Kind::call;
    std::uint32_t serial = 0;
    std::uint32_t replyTo = 0;
    std::string path = {};
    std::string interface = {};
    std::string member = {};
    std::string errorName = {};
    std::string destination = {};
    std::string sender = {};
    std::string signature = {};
    Bytes body = {};

    /// As the bus carries it, little-endian.
    [[nodiscard]] Bytes encode() const;
};

/// The system's message bus with an init system on it, both in one hostile hand, on a thread of its
/// own. It answers one client at a time, each with ideas of its own.
class Bus : private base::NotCopied {
  public:
    Bus(const std::string& path, Random ideas, std::size_t silences);
    ~Bus();

    /// Whether what it says next is what an init system would.
    void behave(bool does) { behaves_ = does; }
    [[nodiscard]] bool behaves() const { return behaves_; }
    /// It tells of the ends of many other jobs before that of the one that a call has begun.
    void beTalkative() { isTalkative_ = true; }

    /// Messages that it has said in answer to something.
    [[nodiscard]] std::uint64_t exchanges() const { return exchanges_; }
    /// The time that it has told last, as the time when the timer elapses; none when that was no
    /// time.
    [[nodiscard]] std::optional<std::uint64_t> toldTime() const;
    /// Services that it has started, as one does that behaves.
    [[nodiscard]] std::uint64_t servicesStarted() const { return servicesStarted_; }

  private:
    void run();
    void serve(int connection);
    [[nodiscard]] bool greet(int connection);
    /// False when the client is to be hung up on.
    [[nodiscard]] bool answer(int connection, const BusMessage& call);
    [[nodiscard]] Bytes properReplies(const BusMessage& call);
    [[nodiscard]] Bytes hostileReplies(const BusMessage& call);
    [[nodiscard]] BusMessage reply(const BusMessage& call, std::string signature, Bytes body);
    [[nodiscard]] Bytes jobRemoved(const std::string& job);
    [[nodiscard]] bool awaitInput(int connection) const;
    [[nodiscard]] std::optional<Bytes> receive(int connection, std::size_t length) const;
    [[nodiscard]] std::optional<BusMessage> receiveCall(int connection);
    [[nodiscard]] bool send(int connection, const Bytes& bytes) const;
    void talk(int connection, const BusMessage& call, bool forEver);

    base::FileDescriptor listener_;
    base::FileDescriptor stop_;
    Random ideas_;
    std::size_t silences_;
    std::atomic<bool> behaves_ = true;
    std::atomic<bool> isTalkative_ = false;
    std::atomic<std::uint64_t> exchanges_ = 0;
    std::atomic<std::uint64_t> servicesStarted_ = 0;
    std::uint32_t serial_ = 0;
    std::uint32_t job_ = 0;
    bool breaksOff_ = false;
    /// When the timer elapses, as an init system that behaves has it.
    std::uint64_t timer_ = ~std::uint64_t{0};
    mutable std::mutex toldLock_;
    std::optional<std::uint64_t> toldTime_;
    std::thread thread_;
};

} // namespace neighbours
