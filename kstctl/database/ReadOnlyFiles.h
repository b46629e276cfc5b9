#pragma once

namespace kstctl {

/// Registers with SQLite, once in the process, a way to its files that only reads: whatever SQLite
/// does through it, no file is made, changed or deleted. A file that is not there cannot be opened.
///
/// Returns the name that connections are opened with, or null when SQLite has no files at all.
[[nodiscard]] const char* registerReadOnlyFiles();

} // namespace kstctl
