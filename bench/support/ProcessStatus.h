#pragma once

#include <cstddef>
#include <sys/types.h>

namespace bench {

/// The memory of a process, in bytes.
struct ProcessMemory {
    std::size_t resident = 0;
    /// The most that was ever resident.
    std::size_t peak = 0;
    /// Resident, shared pages counted in part, by how many share them; 0 when the system does not
    /// say.
    std::size_t proportional = 0;
    /// The pages that no other process has, written or not; 0 when the system does not say.
    std::size_t own = 0;
};

/// Throws when the system does not say.
[[nodiscard]] ProcessMemory memoryOf(pid_t process);

/// The CPU time that the main thread of the process has used, in nanoseconds. Throws when the
/// system does not say.
[[nodiscard]] double cpuTimeOf(pid_t process);

/// How many shared libraries the process has mapped, the dynamic linker and the kernel's own not
/// counted. Throws when the system does not say.
[[nodiscard]] std::size_t sharedLibrariesOf(pid_t process);

} // namespace bench
