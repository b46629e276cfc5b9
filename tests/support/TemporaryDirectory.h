#pragma once

#include "base/NotCopied.h"

#include <filesystem>
#include <stdexcept>
#include <stdlib.h>
#include <string>
#include <unistd.h>

namespace support {

/// Where syncs cost nothing, for what need not outlive the machine.
inline std::filesystem::path directoryInMemory() {
    const std::filesystem::path memory = "/dev/shm";
    return ::access(memory.c_str(), W_OK) == 0 ? memory : std::filesystem::temp_directory_path();
}

/// A private directory for one test, removed with everything in it at the end.
class TemporaryDirectory : private base::NotCopied {
  public:
    TemporaryDirectory() : TemporaryDirectory(std::filesystem::temp_directory_path()) {}
    explicit TemporaryDirectory(const std::filesystem::path& parent) {
        std::string pattern = (parent / "kstd-test.XXXXXX").string();
        if (::mkdtemp(pattern.data()) == nullptr) {
            throw std::runtime_error("cannot make a temporary directory");
        }
        path_ = pattern;
    }
    ~TemporaryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }
    [[nodiscard]] std::string file(const std::string& name) const {
        return (path_ / name).string();
    }

  private:
    std::filesystem::path path_;
};

} // namespace support
