#pragma once

#include "base/NotCopied.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace platform {

/// When the system may read a file's bytes. Linux has no such classes: the value is accepted and
/// has no effect there.
enum class ProtectionClass : int {
    complete = 1,
    completeUnlessOpen = 2,
    untilFirstUserAuthentication = 3,
    none = 4,
};

inline constexpr int kNoClassOptions = 0;

/// What an open call gave: a descriptor, or one below 0 when it failed. The descriptor belongs to
/// the caller until a stream is attached to it.
struct OpenFile {
    int descriptor = -1;
    /// The path it was opened under, for the sync of its directory.
    std::string path;
};

/// A file opened for writing through a stream. It is unbuffered: what `write` has counted is with
/// the system.
class FileStream : private base::NotCopied {
  public:
    /// Closes the stream if that was not done.
    virtual ~FileStream() = default;

    /// Writes `count` elements of `elementSize` bytes at the stream's position, starting at 0.
    /// Returns how many whole elements were written; fewer than `count` is a failure.
    [[nodiscard]] virtual std::size_t write(const void* data, std::size_t elementSize,
                                            std::size_t count) = 0;

    /// Forces what was written to permanent storage, and the file's name too when this process has
    /// not done so before. 0 on success, else the error's number.
    [[nodiscard]] virtual int fullSync() = 0;

    /// Closes the stream and its descriptor. 0 on success, else not 0. Whatever the result, the
    /// stream is closed after it; a further call does nothing and returns not 0.
    virtual int close() = 0;
};

/// Files by absolute path. Called on the main thread only.
///
/// What fails, but for a file that is missing when it is loaded, leaves a line in the log with the
/// reason: once for each reason until the same works again.
class Files : private base::NotCopied {
  public:
    virtual ~Files() = default;

    /// Opens `path` to read and write, makes it when it is not there, never truncates it. A new
    /// file has exactly the permission bits `mode`, an existing one keeps its own.
    [[nodiscard]] virtual OpenFile openForWriting(const std::string& path,
                                                  ProtectionClass protection, int classOptions,
                                                  unsigned mode) = 0;

    /// Attaches a stream to the descriptor, which then belongs to the stream. Null when that
    /// failed: the descriptor stays open and the caller's. Attaching does not truncate.
    [[nodiscard]] virtual std::unique_ptr<FileStream> attachStream(const OpenFile& file) = 0;

    /// The file's first kMaxLoadSize bytes, or all when it has fewer; an empty buffer when it is
    /// empty, none when it is missing, not a regular file or unreadable.
    [[nodiscard]] virtual std::optional<std::vector<std::uint8_t>>
    load(const std::string& path) = 0;

    /// Where a library that opens files by itself finds the one that programs call `path`.
    [[nodiscard]] virtual std::string locate(const std::string& path) const = 0;
};

/// What `load` reads at the most. The daemon's own files are tens of bytes.
inline constexpr std::size_t kMaxLoadSize = 1024UL * 1024;

} // namespace platform
