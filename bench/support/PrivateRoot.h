#pragma once

#include "platform/linux/Paths.h"
#include "wire/SystemPaths.h"

#include <filesystem>

namespace bench {

/// Makes the directories of the system that the daemon needs under `root`.
inline platform::Paths makePrivateRoot(const std::filesystem::path& root) {
    platform::Paths paths(root.string());
    for (const char* const directory : {wire::kDaemonDirectory, wire::kKernelDirectory, "/etc/kstd",
                                        "/var/root", "/var/lib/kstd/alarms"}) {
        std::filesystem::create_directories(paths.under(directory));
    }
    return paths;
}

} // namespace bench
