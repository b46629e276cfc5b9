#pragma once

#include "base/NotCopied.h"

#include <fcntl.h>
#include <stdexcept>
#include <string>
#include <sys/mman.h>
#include <unistd.h>
#include <vector>

namespace support {

/// Takes this process's standard error, from construction to destruction.
class StandardErrorCapture : private base::NotCopied {
  public:
    StandardErrorCapture()
        : original_(::dup(STDERR_FILENO)), file_(::memfd_create("standard-error", MFD_CLOEXEC)) {
        // Appending, because only that keeps the writes of several threads apart on such a file.
        if (original_ < 0 || file_ < 0 || ::fcntl(file_, F_SETFL, O_APPEND) != 0 ||
            ::dup2(file_, STDERR_FILENO) < 0) {
            throw std::runtime_error("cannot redirect standard error");
        }
    }
    ~StandardErrorCapture() {
        ::dup2(original_, STDERR_FILENO);
        ::close(original_);
        ::close(file_);
    }

    /// All that was written so far.
    [[nodiscard]] std::string text() const {
        std::string text(static_cast<std::size_t>(::lseek(file_, 0, SEEK_END)), '\0');
        const ssize_t count = ::pread(file_, text.data(), text.size(), 0);
        text.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
        return text;
    }

    /// The lines, of which the last must be complete too.
    [[nodiscard]] std::vector<std::string> lines() const {
        std::vector<std::string> lines;
        std::string rest = text();
        for (std::size_t end = rest.find('\n'); end != std::string::npos; end = rest.find('\n')) {
            lines.push_back(rest.substr(0, end));
            rest.erase(0, end + 1);
        }
        if (!rest.empty()) {
            throw std::runtime_error("a line without an end: " + rest);
        }
        return lines;
    }

  private:
    int original_;
    int file_;
};

} // namespace support
