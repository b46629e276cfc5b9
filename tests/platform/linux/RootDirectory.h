#pragma once

#include "platform/linux/Paths.h"
#include "tests/support/TemporaryDirectory.h"

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>
#include <vector>

namespace support {

/// A private root directory for the Linux platform. Paths are the ones that programs know.
class RootDirectory {
  public:
    RootDirectory() : paths_(directory_.path().string()) {}

    [[nodiscard]] const platform::Paths& paths() const { return paths_; }
    [[nodiscard]] std::string real(const std::string& path) const { return paths_.under(path); }

    void makeDirectory(const std::string& path) const {
        std::filesystem::create_directories(real(path));
    }

    void put(const std::string& path, const std::vector<std::uint8_t>& bytes,
             unsigned mode = 0600) const {
        {
            std::ofstream file(real(path), std::ios::binary | std::ios::trunc);
            file.write(reinterpret_cast<const char*>(bytes.data()),
                       static_cast<std::streamsize>(bytes.size()));
        }
        setMode(path, mode);
    }

    void put(const std::string& path, const std::string& text, unsigned mode = 0600) const {
        put(path, std::vector<std::uint8_t>(text.begin(), text.end()), mode);
    }

    void setMode(const std::string& path, unsigned mode) const {
        std::filesystem::permissions(real(path), static_cast<std::filesystem::perms>(mode));
    }

    [[nodiscard]] std::optional<std::vector<std::uint8_t>> bytesOf(const std::string& path) const {
        std::ifstream file(real(path), std::ios::binary);
        if (!file) {
            return std::nullopt;
        }
        return std::vector<std::uint8_t>(std::istreambuf_iterator<char>(file), {});
    }

    [[nodiscard]] unsigned modeOf(const std::string& path) const {
        return static_cast<unsigned>(std::filesystem::status(real(path)).permissions());
    }

  private:
    TemporaryDirectory directory_;
    platform::Paths paths_;
};

} // namespace support
