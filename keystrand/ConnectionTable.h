#pragma once

#include "keystrand/Acceptor.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <utility>

namespace keystrand {

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
