#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "keystrand/EventLoop.h"
#include "keystrand/Timers.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>

namespace keystrand::sessions {

/// All that is ever said to keystrand.
enum class Word { locked, unlocked, goingToSleep, awake };

/// The way to keystrand. Everything happens on the thread of the loop.
class KeystrandLink : private base::NotCopied {
  public:
    struct Handlers {
        /// There is a connection, on which nothing has been said yet.
        std::function<void()> connected;
        /// `goingToSleep` was answered.
        std::function<void()> closed;
        /// The connection is gone. Another one is looked for.
        std::function<void()> lost;
    };

    virtual ~KeystrandLink() = default;

    /// Once. No handler is called from within a call of the link's.
    virtual void start(Handlers handlers) = 0;

    [[nodiscard]] virtual bool isConnected() const = 0;

    /// Nothing without a connection. One that does not take it is closed, and is lost in its turn.
    virtual void say(Word word) = 0;
};

/// The link over a socket's file, where each word is a packet. A connection is tried at the start,
/// and then a second after each that failed or was lost.
class SocketLink : public KeystrandLink {
  public:
    static constexpr std::chrono::seconds kBackoff{1};

    /// The loop and the timers outlive it.
    SocketLink(EventLoop& loop, Timers& timers, std::string path);

    void start(Handlers handlers) override;
    [[nodiscard]] bool isConnected() const override { return static_cast<bool>(source_); }
    void say(Word word) override;

  private:
    void connect();
    void receive();

    EventLoop& loop_;
    std::string path_;
    Handlers handlers_;
    base::FileDescriptor socket_;
    EventSource source_;
    std::unique_ptr<Timer> backoff_;
};

} // namespace keystrand::sessions
