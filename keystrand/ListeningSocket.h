#pragma once

#include "base/FileDescriptor.h"
#include "keystrand/EventLoop.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <sys/types.h>
#include <utility>

namespace keystrand {

/// A Unix socket that listens. The file of one of its own making goes when it goes, unless somebody
/// has put another file in its place. The file of an adopted one is its owner's.
class ListeningSocket {
  public:
    static constexpr mode_t kOwnersOnly = 0600;

    /// `type` is SOCK_SEQPACKET or SOCK_STREAM. A socket file that nobody listens on is replaced.
    /// Who may connect is up to `mode`, and then to the acceptor. None, with a reason for people in
    /// `error`, when somebody listens there or the file cannot be made.
    [[nodiscard]] static std::optional<ListeningSocket>
    open(const std::string& path, int type, std::string& error, mode_t mode = kOwnersOnly);

    /// A socket that listens already and does not block.
    [[nodiscard]] static ListeningSocket adopt(base::FileDescriptor fd);

    ListeningSocket(ListeningSocket&& other) noexcept = default;
    ListeningSocket& operator=(ListeningSocket&& other) = delete;
    ~ListeningSocket();

    [[nodiscard]] int fd() const { return fd_.get(); }

  private:
    struct File {
        std::string path;
        dev_t device;
        ino_t inode;
    };

    ListeningSocket(base::FileDescriptor fd, std::optional<File> file);

    base::FileDescriptor fd_;
    std::optional<File> file_;
};

/// The listening SOCK_SEQPACKET socket that the init system handed over under the name `service`; a
/// closed descriptor when it handed over none. Any other socket that it handed over is closed.
/// None, with a reason for people in `error`, when what has that name is something else.
///
/// Takes the variables that announce sockets out of the environment, so it finds them once.
[[nodiscard]] std::optional<base::FileDescriptor> takeActivatedServiceSocket(std::string& error);

/// The kernel service's socket under a root directory: the one that was handed over, or else one of
/// its own making, with the directories that lead there. None, with a reason for people in `error`,
/// when it cannot be had.
[[nodiscard]] std::optional<ListeningSocket>
openServiceSocket(const std::string& root, base::FileDescriptor activated, std::string& error);

/// Takes connections from a listening socket and hands over those of trusted peers; any other is
/// closed without a word. While it is paused, connections wait in the socket's queue.
class Acceptor {
  public:
    using Handler = std::function<void(base::FileDescriptor connection)>;

    /// The loop outlives it. Root and this process's user are heard.
    Acceptor(EventLoop& loop, ListeningSocket socket, Handler handler);
    /// One user is heard, and nobody else.
    Acceptor(EventLoop& loop, ListeningSocket socket, uid_t user, Handler handler);

    void pause();
    void resume();

  private:
    Acceptor(EventLoop& loop, ListeningSocket socket, std::optional<uid_t> user, Handler handler);

    void accept();
    [[nodiscard]] bool isTrusted(int connection) const;

    ListeningSocket socket_;
    std::optional<uid_t> user_;
    Handler handler_;
    EventSource source_;
    /// Runs when the system had no room for one more connection.
    EventSource retry_;
};

/// The connections of a listening socket, a bounded number at once; more wait until one has gone.
template <typename Connection>
class ConnectionTable {
  public:
    using Ended = std::function<void()>;
    /// Serves an accepted connection and calls `ended`, which destroys it, when that is over. Null:
    /// it is closed without a word.
    using Serve = std::function<std::unique_ptr<Connection>(base::FileDescriptor fd, Ended ended)>;

    /// The loop outlives the table, and so does what `serve` refers to.
    ConnectionTable(EventLoop& loop, ListeningSocket socket, std::size_t most, Serve serve)
        : most_(most),
          serve_(std::move(serve)),
          acceptor_(loop, std::move(socket),
                    [this](base::FileDescriptor fd) { take(std::move(fd)); }) {}

    [[nodiscard]] std::size_t size() const { return connections_.size(); }

    /// Calls `visit` with each; it may end the one that it is called with.
    template <typename Visit>
    void forEach(Visit visit) {
        for (auto it = connections_.begin(); it != connections_.end();) {
            Connection& connection = *it->second;
            ++it;
            visit(connection);
        }
    }

  private:
    void take(base::FileDescriptor fd) {
        const std::uint64_t id = ++lastId_;
        auto connection = serve_(std::move(fd), [this, id] { drop(id); });
        if (connection == nullptr || !connection->isWatched()) {
            return;
        }
        connections_.emplace(id, std::move(connection));
        if (connections_.size() == most_) {
            acceptor_.pause();
        }
    }

    void drop(std::uint64_t id) {
        connections_.erase(id);
        acceptor_.resume();
    }

    std::size_t most_;
    Serve serve_;
    std::uint64_t lastId_ = 0;
    std::map<std::uint64_t, std::unique_ptr<Connection>> connections_;
    Acceptor acceptor_;
};

} // namespace keystrand
