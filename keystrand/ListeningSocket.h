#pragma once

#include "base/FileDescriptor.h"

#include <optional>
#include <string>
#include <sys/types.h>

namespace keystrand {

/// A Unix socket that listens. One of its own making has mode 0600, and its file goes when it goes,
/// unless somebody has put another file in its place. The file of an adopted one is its owner's.
class ListeningSocket {
  public:
    /// `type` is SOCK_SEQPACKET or SOCK_STREAM. A socket file that nobody listens on is replaced.
    /// None, with a reason for people in `error`, when somebody does or the file cannot be made.
    [[nodiscard]] static std::optional<ListeningSocket> open(const std::string& path, int type,
                                                             std::string& error);

    /// A socket that listens already and does not block.
    [[nodiscard]] static ListeningSocket adopt(base::FileDescriptor fd);

    ListeningSocket(ListeningSocket&& other) noexcept = default;
    ListeningSocket& operator=(ListeningSocket&& other) = delete;
    ListeningSocket(const ListeningSocket&) = delete;
    ListeningSocket& operator=(const ListeningSocket&) = delete;
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

} // namespace keystrand
