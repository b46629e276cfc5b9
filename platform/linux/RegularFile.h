#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace platform {

/// Why a file was not read.
enum class ReadFailure { none, missing, notRegular, tooLarge, unreadable };

/// What reading a file gave.
struct RegularFile {
    ReadFailure failure = ReadFailure::none;
    /// The error's number when the failure is `missing` or `unreadable`.
    int error = 0;
    /// Its bytes when there was no failure, else empty.
    std::vector<std::uint8_t> bytes;
    /// Owner, mode and so on of the very file that was read. Only without a failure.
    struct stat status {};
};

/// What else than a file of the size that is read is taken.
struct ReadingRules {
    /// Of a larger file its first bytes, which is no failure then.
    bool takesBeginning = false;
    /// What a symbolic link at the path leads to; else a link is unreadable (ELOOP).
    bool followsLink = true;
};

/// Reads the whole file at `path`, at most `limit` bytes of it: a larger file is a failure, also
/// one that grows while it is read. Never waits, whatever stands at the path.
[[nodiscard]] RegularFile readRegularFile(const std::string& path, std::size_t limit,
                                          const ReadingRules& rules = {});

/// Why a configuration file that was read with this limit counts for nothing; empty when it counts.
///
/// A file counts when it was read in full, root or the user of this process owns it and nobody else
/// may write it.
[[nodiscard]] std::string distrust(const RegularFile& file, std::size_t limit);

} // namespace platform
