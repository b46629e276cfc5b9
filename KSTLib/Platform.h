#pragma once

#include "platform/KernelChannel.h"
#include "platform/ServiceRegistry.h"
#include "platform/SystemLog.h"

/// What the library stands on: one set for the process. Not synchronised.
namespace kst {

/// Nothing is owned; each outlives its use by the library.
struct LibraryPlatform {
    platform::SystemLog& log;
    platform::ServiceRegistry& registry;
    platform::KernelChannel& channel;
};

/// Makes `platform` what the library stands on and starts the library anew: no connection, the
/// initial log level. A connection that was open before is forgotten, not closed.
void installPlatform(const LibraryPlatform& platform) noexcept;

/// Takes it away and starts the library anew. The library then finds no kernel service and writes
/// no log lines.
void removePlatform() noexcept;

/// What is installed, or null.
[[nodiscard]] const LibraryPlatform* installedPlatform() noexcept;

} // namespace kst
