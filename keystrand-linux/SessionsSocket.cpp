#include "keystrand-linux/SessionsSocket.h"

#include "base/Concat.h"

#include <array>
#include <cerrno>
#include <pwd.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace keystrand::usb {

namespace {

constexpr char kUser[] = "keystrand-sessions";
constexpr mode_t kAnybodyMayConnect = 0666;

constexpr std::string_view kClosed = "closed";

std::optional<LockState::Said> meaningOf(std::string_view word) {
    using Said = LockState::Said;
    constexpr std::pair<std::string_view, Said> kWords[] = {{"locked", Said::locked},
                                                            {"unlocked", Said::unlocked},
                                                            {"going to sleep", Said::goingToSleep},
                                                            {"awake", Said::awake}};
    for (const auto& [text, said] : kWords) {
        if (word == text) {
            return said;
        }
    }
    return std::nullopt;
}

} // namespace

std::optional<uid_t> SessionsSocket::userOfSessions() {
    const passwd* const user = ::getpwnam(kUser);
    return user == nullptr ? std::nullopt : std::optional(user->pw_uid);
}

std::unique_ptr<SessionsSocket> SessionsSocket::open(EventLoop& loop, Timers& timers,
                                                     const std::string& path, uid_t user, Log log,
                                                     std::string& error) {
    auto socket = ListeningSocket::open(path, SOCK_SEQPACKET, error, kAnybodyMayConnect);
    if (!socket) {
        return nullptr;
    }
    return std::make_unique<SessionsSocket>(loop, timers, std::move(*socket), user, std::move(log));
}

SessionsSocket::SessionsSocket(EventLoop& loop, Timers& timers, ListeningSocket socket, uid_t user,
                               Log log)
    : loop_(loop),
      log_(std::move(log)),
      patience_(timers.timer([this] { giveUp(); })),
      acceptor_(loop, std::move(socket), user,
                [this](base::FileDescriptor connection) { take(std::move(connection)); }) {
    patience_->startFor(kPatience);
}

void SessionsSocket::take(base::FileDescriptor connection) {
    patience_->stop();
    // An answer that is due is due to the connection that asked.
    isAnswerDue_ = false;
    source_ = EventSource();
    connection_ = std::move(connection);
    source_ = loop_.watch(connection_.get(), EPOLLIN, [this](std::uint32_t) { receive(); });
    if (!source_) {
        hangUp("there is no room for its connection");
    }
}

void SessionsSocket::receive() {
    // One byte more than the longest word, and one for a record that is longer still.
    std::array<char, 16> packet{};
    const ssize_t size = ::recv(connection_.get(), packet.data(), packet.size(), MSG_TRUNC);
    if (size < 0 && (errno == EAGAIN || errno == EINTR)) {
        return;
    }
    if (size <= 0) {
        hangUp("has hung up");
        return;
    }
    const auto length = static_cast<std::size_t>(size);
    hear(length > packet.size() ? std::string_view() : std::string_view(packet.data(), length));
}

void SessionsSocket::hear(std::string_view word) {
    const auto said = meaningOf(word);
    if (!said) {
        hangUp("has said what is no word of its own");
        return;
    }
    switch (*said) {
    case Said::goingToSleep:
        isAsleep_ = true;
        isAnswerDue_ = true;
        break;
    case Said::awake:
        isAnswerDue_ = false;
        if (!std::exchange(isAsleep_, false)) {
            return;
        }
        break;
    case Said::locked:
    case Said::unlocked:
    case Said::away:
        break;
    }
    say(*said);
}

void SessionsSocket::closed() {
    if (std::exchange(isAnswerDue_, false)) {
        // Who does not take it lets the machine sleep when its own patience ends.
        static_cast<void>(::send(connection_.get(), kClosed.data(), kClosed.size(), MSG_NOSIGNAL));
    }
}

void SessionsSocket::hangUp(std::string_view why) {
    source_ = EventSource();
    connection_.reset();
    isAnswerDue_ = false;
    patience_->startFor(kPatience);
    log_(base::concat("keystrand: keystrand-sessions ", why, "."));
    say(Said::away);
}

void SessionsSocket::giveUp() {
    log_("keystrand: nothing was heard of keystrand-sessions for a minute; the machine counts as "
         "locked.");
    say(Said::locked);
}

void SessionsSocket::say(Said said) {
    if (listener_) {
        listener_(said);
    }
}

} // namespace keystrand::usb
