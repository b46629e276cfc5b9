#pragma once

#include "platform/KernelChannel.h"
#include "platform/ServiceRegistry.h"
#include "platform/SystemLog.h"

#include <chrono>
#include <cstdint>

/// What the library stands on: one set for the process. Not synchronised.
namespace kst {

/// How long an exported function may wait for the kernel side in all, and the clock that says when
/// that is over.
struct CallTime {
    std::chrono::milliseconds limit{5000};
    std::chrono::steady_clock::time_point (*now)() = std::chrono::steady_clock::now;
};
inline constexpr CallTime kUsualCallTime;

/// Nothing is owned; each outlives its use by the library.
struct LibraryPlatform {
    platform::SystemLog& log;
    platform::ServiceRegistry& registry;
    platform::KernelChannel& channel;
    const CallTime& callTime = kUsualCallTime;
};

/// Makes `platform` what the library stands on and starts the library anew: no connection, the
/// initial log level. A connection that was open before is forgotten, not closed.
void installPlatform(const LibraryPlatform& platform) noexcept;

/// Takes it away and starts the library anew. The library then finds no kernel service and writes
/// no log lines.
void removePlatform() noexcept;

/// Makes `log` the one that the library writes to, or none when it is null: all of a platform that
/// is of use to functions which work on their caller's memory alone. It must outlive its use.
void installLog(platform::SystemLog* log) noexcept;

/// What is installed, or null.
[[nodiscard]] const LibraryPlatform* installedPlatform() noexcept;

/// Sees to it that a child of the process begins without a connection and without what calls of
/// other threads held. Done when a platform is installed; false when that failed for want of memory
/// and fails again.
[[nodiscard]] bool watchForks() noexcept;

/// The same by a child of which nobody told, because it was not made by `fork`.
void leaveInheritedToParent() noexcept;

/// Differs between a process and its child.
[[nodiscard]] std::uint64_t processNumber() noexcept;

} // namespace kst
