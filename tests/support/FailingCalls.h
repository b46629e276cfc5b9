#pragma once

#include <deque>
#include <functional>
#include <sys/socket.h>

namespace support {

/// System calls that the linker has wrapped for a test program (link support_failing_calls). What
/// stands in a list here is what the next calls of that kind do instead of their work, one entry
/// each; a test leaves the lists empty.
struct FailingCalls {
    /// The errors that they fail with.
    static inline std::deque<int> read;
    static inline std::deque<int> fstat;
    static inline std::deque<int> recv;
    static inline std::deque<int> send;
    static inline std::deque<int> poll;
    /// Gives what the call returns, with errno set when that is negative.
    static inline std::deque<std::function<ssize_t(msghdr& message)>> recvmsg;
};

} // namespace support
