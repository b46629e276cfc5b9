#pragma once

#include "base/FileDescriptor.h"
#include "keystrand/EventLoop.h"
#include "keystrand/NotificationPublisher.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace keystrand {

/// Sends events to the daemon's event socket, in the order in which they were posted. An event
/// stays queued until the socket has taken it: while the socket is full, while nobody owns it, and
/// while its file is not there.
class EventSender : public EventPoster {
  public:
    static constexpr std::size_t kMaxQueued = 200'000;

    /// The loop outlives the sender.
    EventSender(EventLoop& loop, std::string path);

    bool post(std::string_view stream, std::string_view name) override;

    [[nodiscard]] std::size_t queued() const { return queue_.size(); }
    [[nodiscard]] std::uint64_t sent() const { return sent_; }
    /// Events that were not taken because too many waited.
    [[nodiscard]] std::uint64_t refused() const { return refused_; }

  private:
    void sendQueued();
    [[nodiscard]] bool connectToPresentFile();
    void disconnect();
    void waitForRoom();

    EventLoop& loop_;
    std::string path_;
    std::deque<std::vector<std::uint8_t>> queue_;
    std::uint64_t sent_ = 0;
    std::uint64_t refused_ = 0;
    base::FileDescriptor fd_;
    dev_t device_ = 0;
    ino_t inode_ = 0;
    EventSource writable_;
    EventSource retry_;
    bool waiting_ = false;
};

} // namespace keystrand
