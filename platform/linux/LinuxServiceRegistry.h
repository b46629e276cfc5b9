#pragma once

#include "platform/ServiceRegistry.h"
#include "platform/linux/KernelSocketConnection.h"

#include <cstdint>
#include <map>
#include <string>

namespace platform {

/// ServiceRegistry over the kernel service's socket.
class LinuxServiceRegistry final : public ServiceRegistry {
  public:
    LinuxServiceRegistry(const std::string& socketPath, SystemLog& log,
                         std::chrono::milliseconds timeout = kKernelTimeout);

    [[nodiscard]] ServiceHandle findByPath(std::string_view path) override;
    [[nodiscard]] ServiceHandle findByClassName(std::string_view name) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>>
    copyProperty(ServiceHandle entry, std::string_view name) override;
    void release(ServiceHandle entry) override;

    /// The registry path of an entry that is held, or an empty text.
    [[nodiscard]] std::string pathOf(ServiceHandle entry) const;

  private:
    struct Entry {
        std::string path;
        std::uint64_t references = 0;
    };

    [[nodiscard]] ServiceHandle find(wire::KernelOperation operation, std::string_view key);
    [[nodiscard]] ServiceHandle hold(std::string path);

    KernelSocketConnection connection_;
    std::map<ServiceHandle, Entry> entries_;
    ServiceHandle lastHandle_ = kNoService;
};

} // namespace platform
