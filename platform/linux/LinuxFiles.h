#pragma once

#include "base/FileDescriptor.h"
#include "platform/Files.h"
#include "platform/SystemLog.h"
#include "platform/linux/Paths.h"

#include <map>
#include <set>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <utility>

namespace platform {

/// Files on POSIX, under a root directory.
///
/// Paths are the ones that the programs know ("/var/root/x"); where they lie under the root is
/// added here and nowhere else. Protection classes have no meaning on Linux and are ignored.
/// Directories are never made: a file in a missing one cannot be opened.
///
/// A symbolic link in the place of the file itself is not followed, neither for writing nor for
/// loading. The daemon's own files are never links, and a link there could aim root's writing at
/// any other file.
///
/// The streams must not outlive the LinuxFiles that they come from.
class LinuxFiles final : public Files {
  public:
    LinuxFiles(Paths paths, SystemLog& log);

    [[nodiscard]] OpenFile openForWriting(const std::string& path, ProtectionClass protection,
                                          int classOptions, unsigned mode) override;
    [[nodiscard]] std::unique_ptr<FileStream> attachStream(const OpenFile& file) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>> load(const std::string& path) override;
    [[nodiscard]] std::string locate(const std::string& path) const override {
        return paths_.under(path);
    }

  private:
    friend class LinuxFileStream;

    /// Syncs the directory that holds `path` unless that was done since the file was made. 0 or
    /// the error's number.
    [[nodiscard]] int syncNameOnce(const std::string& path);

    /// Writes why `what` cannot be done with the file, unless it was the last that was said.
    void tell(std::string_view what, const std::string& path, std::string reason);
    void tell(std::string_view what, const std::string& path, int error);
    /// A failure of it is news again.
    void worked(std::string_view what, const std::string& path);

    Paths paths_;
    SystemLog& log_;
    /// By what was to be done and with which file. The former is constant text.
    std::map<std::pair<std::string_view, std::string>, std::string> told_;
    /// Files whose names are on permanent storage as far as this process has seen to it. A file
    /// that was there before it may have been made by a process that was killed before its sync,
    /// so existing files are not in here from the start.
    std::set<std::string, std::less<>> syncedNames_;
};

/// The stream of LinuxFiles. It keeps its own position, so that it begins at 0 whatever was done
/// with the descriptor before.
class LinuxFileStream final : public FileStream {
  public:
    LinuxFileStream(LinuxFiles& files, base::FileDescriptor descriptor, std::string path);

    [[nodiscard]] std::size_t write(const void* data, std::size_t elementSize,
                                    std::size_t count) override;
    [[nodiscard]] int fullSync() override;
    int close() override;

  private:
    LinuxFiles& files_;
    base::FileDescriptor descriptor_;
    std::string path_;
    off_t position_ = 0;
};

} // namespace platform
