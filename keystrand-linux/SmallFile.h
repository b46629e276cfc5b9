#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"

#include <chrono>
#include <cstddef>
#include <ctime>
#include <fcntl.h>
#include <optional>
#include <string>
#include <string_view>
#include <sys/stat.h>

namespace keystrand::usb {

/// More than any text that sysfs shows.
inline constexpr std::size_t kAttributeLimit = 4096;

/// What reading a file from its beginning to its end gave. The size that a file of the kernel's
/// pretends to have is not asked for.
struct SmallFile {
    /// The error's number, EFBIG for what is larger than the limit; 0 when it was read.
    int error = 0;
    /// Empty after an error.
    std::string bytes;
    /// Owner, mode and so on of the very file that was read. Only without an error.
    struct stat status {};

    [[nodiscard]] bool isRead() const { return error == 0; }
};

/// The file at `path`, which is taken from that open directory unless it is absolute. Never waits,
/// whatever stands there.
[[nodiscard]] SmallFile readSmallFile(int directory, const std::string& path, std::size_t limit);
[[nodiscard]] inline SmallFile readSmallFile(const std::string& path, std::size_t limit) {
    return readSmallFile(AT_FDCWD, path, limit);
}

/// Until when a read may wait.
using ReadDeadline = std::chrono::steady_clock::time_point;

/// While it lives, and from a moment on, whatever the thread waits for inside the kernel is
/// interrupted again and again, where it can be: the call ends with EINTR. One at a time, in a
/// program of one thread.
class Interruptions : private base::NotCopied {
  public:
    explicit Interruptions(ReadDeadline from);
    ~Interruptions();

  private:
    std::optional<timer_t> timer_;
};

/// The same of a file on which the kernel may have its reader wait as long as it is busy. ETIMEDOUT
/// when it still is at that time, a few milliseconds later when the time is over; whoever need not
/// wait reads, however late it is.
[[nodiscard]] SmallFile readSmallFileUntil(int directory, const char* name, std::size_t limit,
                                           ReadDeadline until);

/// Writes the text with one call into a file that is there already. The error's number, or 0.
[[nodiscard]] int writeAttribute(int directory, const char* name, std::string_view text);

/// Not open, with errno set, when there is none.
[[nodiscard]] base::FileDescriptor openDirectory(const std::string& path);

/// What a number of errno means to people.
[[nodiscard]] std::string errorText(int error);

/// Without the end of a line, and blanks, at either end.
[[nodiscard]] std::string_view trimmed(std::string_view text);

} // namespace keystrand::usb
