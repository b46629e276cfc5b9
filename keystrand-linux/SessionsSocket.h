#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-linux/LockState.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"
#include "keystrand/Timers.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

namespace keystrand::usb {

/// The lock state over the socket at which `keystrand-sessions` speaks: packets of one word each,
/// "locked", "unlocked", "going to sleep" or "awake", and "closed" in answer to the third.
///
/// Anybody may connect, and only one user is heard: whoever else does is hung up on. The process
/// must see the users of the machine (not with PrivateUsers=). The newest connection is the one
/// that counts. One that says anything else is closed, with a line.
class SessionsSocket : public LockState {
  public:
    static constexpr std::chrono::minutes kPatience{1};

    /// Takes a line for the log, which is complete.
    using Log = std::function<void(const std::string& line)>;

    /// The user that `keystrand-sessions` runs as; none where there is no such user.
    [[nodiscard]] static std::optional<uid_t> userOfSessions();

    /// None, with a reason for people in `error`, when the socket cannot be made. The loop and the
    /// timers outlive it.
    [[nodiscard]] static std::unique_ptr<SessionsSocket> open(EventLoop& loop, Timers& timers,
                                                              const std::string& path, uid_t user,
                                                              Log log, std::string& error);

    SessionsSocket(EventLoop& loop, Timers& timers, ListeningSocket socket, uid_t user, Log log);

    void listen(Listener listener) override { listener_ = std::move(listener); }
    void closed() override;

  private:
    void take(base::FileDescriptor connection);
    void receive();
    void hear(std::string_view word);
    void hangUp(std::string_view why);
    void giveUp();
    void say(Said said);

    EventLoop& loop_;
    Log log_;
    Listener listener_;
    /// Whether `goingToSleep` was said, and not `awake`.
    bool isAsleep_ = false;
    bool isAnswerDue_ = false;
    std::unique_ptr<Timer> patience_;
    base::FileDescriptor connection_;
    EventSource source_;
    Acceptor acceptor_;
};

} // namespace keystrand::usb
