#pragma once

#include "platform/Files.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
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

class FakeFiles;

/// The stream of FakeFiles.
class FakeFileStream final : public FileStream {
  public:
    FakeFileStream(FakeFiles& files, int descriptor, std::shared_ptr<FakeFile> file,
                   std::string path);
    ~FakeFileStream() override;

    [[nodiscard]] std::size_t write(const void* data, std::size_t elementSize,
                                    std::size_t count) override;
    [[nodiscard]] int fullSync() override;
    int close() override;

  private:
    [[nodiscard]] int closeNow();

    FakeFiles& files_;
    int descriptor_;
    /// Null when closed.
    std::shared_ptr<FakeFile> file_;
    std::string path_;
    std::size_t position_ = 0;
};

/// What the next operation of a kind shall do instead of working. Each happens once.
struct FakeFileFailures {
    bool open = false;
    bool attach = false;
    /// The next write takes at most this many bytes.
    std::optional<std::size_t> writeAtMost;
    /// The next sync leaves everything unsynced and gives this error.
    int sync = 0;
    /// The next close of an open stream closes it and gives this error.
    int close = 0;
    bool load = false;
};

/// Files of one process on a FakeDisk. As on a real system the lowest free descriptor number is
/// given out next, and a file's name is synced with the first sync of the process.
///
/// Libraries cannot open files of a FakeDisk: what they open by themselves lies in a real
/// directory, `realRoot`.
///
/// The streams must not outlive it.
class FakeFiles final : public Files {
  public:
    explicit FakeFiles(FakeDisk& disk, std::string realRoot = kNoRealRoot)
        : disk_(disk), realRoot_(std::move(realRoot)) {}

    /// A root under which nothing can be made.
    static constexpr char kNoRealRoot[] = "/dev/null";

    [[nodiscard]] OpenFile openForWriting(const std::string& path, ProtectionClass protection,
                                          int classOptions, unsigned mode) override;
    [[nodiscard]] std::unique_ptr<FileStream> attachStream(const OpenFile& file) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>> load(const std::string& path) override;
    [[nodiscard]] std::string locate(const std::string& path) const override {
        return realRoot_ + path;
    }

    /// What was called, in order: "open /var/root/x", "attach", "write 13" (the bytes asked for),
    /// "sync", "close", "load /var/root/x". A stream that is destroyed open closes itself.
    [[nodiscard]] const std::vector<std::string>& calls() const { return calls_; }
    void clearCalls() { calls_.clear(); }

    FakeFileFailures failures;

    [[nodiscard]] std::size_t openDescriptors() const { return descriptors_.size(); }
    [[nodiscard]] std::size_t openStreams() const { return openStreams_; }

    /// What a file was last opened with beside its mode.
    struct Protection {
        ProtectionClass protection = ProtectionClass::none;
        int classOptions = kNoClassOptions;

        friend bool operator==(const Protection&, const Protection&) = default;
    };
    [[nodiscard]] std::optional<Protection> protectionOf(const std::string& path) const;

    /// Closes a descriptor to which no stream was attached.
    void closeDescriptor(int descriptor) { descriptors_.erase(descriptor); }

    /// What was not synced is thrown away.
    void crash() { disk_.crash(); }

  private:
    friend class FakeFileStream;

    [[nodiscard]] int lowestFreeDescriptor() const;
    [[nodiscard]] int sync(FakeFile& file, const std::string& path);

    FakeDisk& disk_;
    std::string realRoot_;
    std::vector<std::string> calls_;
    std::map<int, std::shared_ptr<FakeFile>> descriptors_;
    std::map<std::string, Protection> protections_;
    std::set<std::string> syncedNames_;
    std::size_t openStreams_ = 0;
};

} // namespace platform
