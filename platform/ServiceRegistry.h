#pragma once

#include "platform/KernelConnections.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace platform {

/// Names an entry of the service registry in this process. 0 is no entry.
using ServiceHandle = std::uint32_t;
inline constexpr ServiceHandle kNoService = 0;

/// The registry in which the kernel service publishes itself and its properties.
///
/// Called on one thread at a time. Every handle that a find operation returns is owned by the
/// caller and given back with `release`; finding the same entry twice gives two references to it.
/// A registry that is not there has no entries.
class ServiceRegistry : public KernelConnections {
  public:
    /// The entry at `path` (for example "IOService:/IOResources/Keystrand"), looked up anew on
    /// every call, or kNoService; that too when the kernel service cannot be asked.
    [[nodiscard]] virtual ServiceHandle findByPath(std::string_view path) = 0;

    /// The first entry whose class has this name, or kNoService. A kernel service that is there and
    /// cannot be asked is found: to open it fails with the reason.
    [[nodiscard]] virtual ServiceHandle findByClassName(std::string_view name) = 0;

    /// A copy of the property as it stands now. None when the entry has no such property, is gone,
    /// or cannot be asked; a property without bytes is an empty buffer, which is not none.
    [[nodiscard]] virtual std::optional<std::vector<std::uint8_t>>
    copyProperty(ServiceHandle entry, std::string_view name) = 0;

    /// Gives one reference back. A handle that is not held is ignored.
    virtual void release(ServiceHandle entry) = 0;
};

} // namespace platform
