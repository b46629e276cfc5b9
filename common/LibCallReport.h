#pragma once

#include "KSTLib/Status.h"
#include "common/AssertLine.h"
#include "common/LibraryLog.h"

/// How the LibCall functions report failures.
namespace kst {

inline constexpr const char* kLibCallTag = "KST";

/// The context of a failed check in the source `path`: the library's log.
[[nodiscard]] inline AssertionContext libCallContext(const char* path) noexcept {
    return {libraryLog(), kLibCallTag, path};
}

/// Prints the line of a failed return to standard output and flushes it, so that it is not lost
/// with the process; prints nothing on success. Hands `status` back.
KSTStatus printReturn(const char* function, KSTStatus status) noexcept;

} // namespace kst
