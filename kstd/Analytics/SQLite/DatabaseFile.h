#pragma once

#include "platform/Result.h"

#include <optional>
#include <string>

namespace kstd {

/// Makes the directory that `path` lies in, and those above it, for the owner alone. What exists is
/// left as it is and counts as made, also when it is no directory. The error says what could not be
/// made.
[[nodiscard]] std::optional<platform::Error> makeParentDirectories(const std::string& path);

/// Makes an empty file, for the owner alone whatever the umask is, unless there is something at
/// `path`. SQLite gives the files that it keeps beside the database the same mode. True when there
/// was nothing: whatever is there once SQLite has opened it is new, and is given to the owner alone
/// by `keepForOwner`, also if making it here has failed.
///
/// An existing file is not even opened: closing it would drop the locks that other connections of
/// this process have on it.
[[nodiscard]] bool createDatabaseFile(const std::string& path);
void keepForOwner(const std::string& path);

/// Registers with SQLite, once in the process, its own way to files with one difference: the index
/// of a log, which SQLite maps, has its blocks before anybody uses it. SQLite alone writes one byte
/// in each 4096 of it; where blocks are smaller and the disk is full, the next store into the
/// mapping is a SIGBUS. With these files it is SQLITE_FULL, for a connection that only reads as
/// well. Before Linux 5.14 they are as SQLite's own.
///
/// Returns the name to open connections with; it is unknown to SQLite when it could not be
/// registered. From any thread.
[[nodiscard]] const char* registerDatabaseFiles();

/// Deletes the file and what SQLite keeps beside it. What cannot be deleted stays.
void removeDatabaseFiles(const std::string& path);

} // namespace kstd
