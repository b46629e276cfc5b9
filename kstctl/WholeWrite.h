#pragma once

#include <cerrno>
#include <cstddef>
#include <string>
#include <string_view>
#include <unistd.h>

namespace kstctl {

/// Writes all of it. False, with errno set, when that is not possible.
[[nodiscard]] inline bool writeWhole(int descriptor, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t written = ::write(descriptor, bytes.data(), bytes.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        bytes.remove_prefix(written > 0 ? static_cast<std::size_t>(written) : 0);
    }
    return true;
}

/// Writes what it is given in large pieces. After the first failure nothing more is written.
class BufferedWriter {
  public:
    explicit BufferedWriter(int descriptor) : descriptor_(descriptor) {}

    void put(std::string_view bytes) {
        buffer_.append(bytes);
        if (buffer_.size() >= kPiece) {
            flush();
        }
    }

    /// Writes what is left: 0, or the number of the first error.
    [[nodiscard]] int finish() {
        flush();
        return error_;
    }

  private:
    static constexpr std::size_t kPiece = 64UL * 1024;

    void flush() {
        if (error_ == 0 && !writeWhole(descriptor_, buffer_)) {
            error_ = errno;
        }
        buffer_.clear();
    }

    int descriptor_;
    int error_ = 0;
    std::string buffer_;
};

} // namespace kstctl
