#pragma once

#include "base/NotCopied.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <stdexcept>
#include <string>
#include <sys/mman.h>
#include <unistd.h>

namespace support {

/// Takes what the process prints to standard output from here to the end of the scope. `text` shows
/// only what has really left the process: what is not flushed yet is not in it.
///
/// GoogleTest says on standard output why a test fails. So what was taken is given back at the end
/// when the test has failed.
class StandardOutputCapture : private base::NotCopied {
  public:
    StandardOutputCapture()
        : file_(::memfd_create("standard-output", MFD_CLOEXEC)), saved_(::dup(STDOUT_FILENO)) {
        std::fflush(stdout);
        if (file_ < 0 || saved_ < 0 || ::dup2(file_, STDOUT_FILENO) < 0) {
            throw std::runtime_error("cannot capture standard output");
        }
    }
    ~StandardOutputCapture() {
        std::fflush(stdout);
        ::dup2(saved_, STDOUT_FILENO);
        if (testing::Test::HasFailure()) {
            const std::string taken = text();
            std::fwrite(taken.data(), 1, taken.size(), stdout);
            std::fflush(stdout);
        }
        ::close(saved_);
        ::close(file_);
    }

    [[nodiscard]] std::string text() const {
        std::string text;
        char buffer[512];
        ssize_t count = 0;
        while ((count = ::pread(file_, buffer, sizeof buffer, static_cast<off_t>(text.size()))) >
               0) {
            text.append(buffer, static_cast<std::size_t>(count));
        }
        return text;
    }

  private:
    int file_;
    int saved_;
};

} // namespace support
