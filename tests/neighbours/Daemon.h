#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace neighbours {

/// What a process must not gather.
struct Footprint {
    std::size_t descriptors = 0;
    std::size_t kilobytes = 0;

    /// Of a running process: its open descriptors, and the memory that it has written to. What it
    /// has of files is shared with others as they come and go.
    [[nodiscard]] static Footprint of(pid_t process);
    /// Of this process: its open descriptors, and what is allocated of its heap. What lies between
    /// grows with the largest message that anybody has announced.
    [[nodiscard]] static Footprint ofThis();
};

/// A daemon, or another program that serves, as a process, with all that it says. A line that
/// nobody could read, or read safely, is a fault.
class Daemon : private base::NotCopied {
  public:
    /// The event socket stays the caller's, so that what is queued in it outlives a daemon; -1 is
    /// none. It is ready when it has said a line that ends in `ready`.
    Daemon(const std::vector<std::string>& arguments, int eventSocket, std::string ready);
    ~Daemon();

    [[nodiscard]] pid_t process() const { return process_; }

    /// Takes what it has said meanwhile.
    void listen();

    [[nodiscard]] std::uint64_t lines() const { return lines_; }
    [[nodiscard]] bool isReady() const { return isReady_; }
    /// The newest lines, for a report.
    [[nodiscard]] const std::deque<std::string>& newest() const { return newest_; }

    /// Whether it still runs. How it ended otherwise is in `ending`.
    [[nodiscard]] bool runs();
    [[nodiscard]] const std::string& ending() const { return ending_; }

    /// Asks it to end.
    void ask() const;

  private:
    void take(std::string_view line);

    pid_t process_ = -1;
    bool hasEnded_ = false;
    std::string ending_;
    base::FileDescriptor output_;
    std::string partial_;
    std::uint64_t lines_ = 0;
    std::string ready_;
    bool isReady_ = false;
    std::deque<std::string> newest_;
};

} // namespace neighbours
