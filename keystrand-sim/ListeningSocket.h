#pragma once

#include "base/FileDescriptor.h"

#include <optional>
#include <string>
#include <sys/types.h>

namespace sim {

/// A Unix socket that listens, mode 0600. Its file goes when it goes, unless somebody has put
/// another file in its place.
class ListeningSocket {
  public:
    /// `type` is SOCK_SEQPACKET or SOCK_STREAM. A socket file that nobody listens on is replaced.
    /// None, with a reason for people in `error`, when somebody does or the file cannot be made.
    [[nodiscard]] static std::optional<ListeningSocket> open(const std::string& path, int type,
                                                             std::string& error);

    ListeningSocket(ListeningSocket&& other) noexcept = default;
    ListeningSocket& operator=(ListeningSocket&& other) = delete;
    ListeningSocket(const ListeningSocket&) = delete;
    ListeningSocket& operator=(const ListeningSocket&) = delete;
    ~ListeningSocket();

    [[nodiscard]] int fd() const { return fd_.get(); }

  private:
    ListeningSocket(base::FileDescriptor fd, std::string path, dev_t device, ino_t inode);

    base::FileDescriptor fd_;
    std::string path_;
    dev_t device_;
    ino_t inode_;
};

} // namespace sim
