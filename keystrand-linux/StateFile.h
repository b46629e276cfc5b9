#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

namespace keystrand::usb {

/// A small text file that is always replaced as a whole: whoever reads it, whenever, sees one text
/// or the next one.
class StateFile {
  public:
    static constexpr std::size_t kMaxSize = std::size_t{4} << 20U;

    enum class Durability : bool {
        /// Gone with the machine's memory.
        none,
        /// On the disk, with its name, when `replace` returns.
        synced,
    };

    StateFile(std::string path, Durability durability)
        : path_(std::move(path)), durability_(durability) {}

    /// What is in it; none when there is no file. Any other failure, and a file that is larger than
    /// kMaxSize, is none with the reason for people in `problem`.
    [[nodiscard]] std::optional<std::string> read(std::string& problem) const;

    /// Mode 0600. False, with what was there before and the reason in `problem`.
    [[nodiscard]] bool replace(std::string_view text, std::string& problem) const;

    /// True also when there was none.
    [[nodiscard]] bool remove(std::string& problem) const;

    [[nodiscard]] const std::string& path() const { return path_; }

  private:
    std::string path_;
    Durability durability_;
};

} // namespace keystrand::usb
