#pragma once

#include "platform/KernelChannel.h"
#include "platform/linux/KernelSocketConnection.h"
#include "platform/linux/LinuxServiceRegistry.h"

#include <memory>
#include <string>
#include <vector>

namespace platform {

/// KernelChannel over the kernel service's socket: two system calls a call, no allocation.
class LinuxKernelChannel final : public KernelChannel {
  public:
    /// The registry, which knows what the service handles stand for, outlives the channel.
    LinuxKernelChannel(std::string socketPath, const LinuxServiceRegistry& registry, SystemLog& log,
                       std::chrono::milliseconds timeout = kKernelTimeout);

    [[nodiscard]] Status open(ServiceHandle service, std::uint32_t connectionType,
                              ConnectionHandle* connection) override;
    [[nodiscard]] Status structCall(ConnectionHandle connection, std::uint32_t selector,
                                    const void* input, std::size_t inputSize, void* output,
                                    std::size_t* outputSize) override;
    [[nodiscard]] Status scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                    const std::uint64_t* inputs, std::uint32_t inputCount,
                                    std::uint64_t* outputs, std::uint32_t* outputCount) override;

  private:
    [[nodiscard]] KernelSocketConnection* find(ConnectionHandle connection);

    std::string socketPath_;
    const LinuxServiceRegistry& registry_;
    SystemLog& log_;
    std::chrono::milliseconds timeout_;
    std::vector<std::unique_ptr<KernelSocketConnection>> connections_;
};

} // namespace platform
