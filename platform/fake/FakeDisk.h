#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

using FakeBytes = std::vector<std::uint8_t>;

/// A regular file of a FakeDisk. What was written and what would survive a power cut are kept
/// apart.
struct FakeFile {
    unsigned mode = 0600;
    FakeBytes bytes;
    /// The bytes as of the last sync.
    FakeBytes syncedBytes;
    /// Whether the directory that names the file was synced since the file was made.
    bool nameSynced = false;

    /// Overwrites from `offset` on; a gap before it reads as zeros.
    void write(std::size_t offset, const std::uint8_t* data, std::size_t size);
};

/// The files of a machine, which outlive its processes. Directories are made by the test.
class FakeDisk {
  public:
    void makeDirectory(std::string_view path) { directories_.emplace(path); }
    [[nodiscard]] bool isDirectory(std::string_view path) const;

    /// The file at `path`, or null. It may be open while it is removed.
    [[nodiscard]] std::shared_ptr<FakeFile> find(std::string_view path) const;

    /// A new empty file at `path`, in the place of what stands there. Null when its directory is
    /// missing or a directory stands there.
    std::shared_ptr<FakeFile> make(std::string_view path, unsigned mode);

    /// Puts a file there as an earlier process left it: written, and synced with its name.
    void put(std::string_view path, const FakeBytes& bytes, unsigned mode = 0600);

    void remove(std::string_view path);

    /// The bytes of the file at `path` as a program would read them, or none.
    [[nodiscard]] std::optional<FakeBytes> read(std::string_view path) const;

    /// The power fails: bytes that were not synced are as before, files whose name was not synced
    /// are gone.
    void crash();

  private:
    std::set<std::string, std::less<>> directories_ = {"/"};
    std::map<std::string, std::shared_ptr<FakeFile>, std::less<>> files_;
};

} // namespace platform
