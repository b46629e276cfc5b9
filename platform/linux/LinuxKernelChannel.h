#pragma once

#include "platform/KernelChannel.h"
#include "platform/linux/KernelSocketConnection.h"
#include "platform/linux/LinuxServiceRegistry.h"

#include <array>
#include <cstddef>
#include <optional>
#include <string_view>

namespace platform {

/// KernelChannel over the kernel service's socket: two system calls a call, no allocation.
class LinuxKernelChannel final : public KernelChannel {
  public:
    /// One more gives the status of EMFILE.
    static constexpr std::size_t kMaxConnections = 16;

    /// The registry, which knows what the service handles stand for and which program asks,
    /// outlives the channel.
    LinuxKernelChannel(std::string_view socketPath, const LinuxServiceRegistry& registry,
                       SystemLog& log, std::chrono::milliseconds timeout = kKernelTimeout);

    [[nodiscard]] Status open(ServiceHandle service, std::uint32_t connectionType,
                              ConnectionHandle* connection) override;
    [[nodiscard]] Status structCall(ConnectionHandle connection, std::uint32_t selector,
                                    const void* input, std::size_t inputSize, void* output,
                                    std::size_t* outputSize) override;
    [[nodiscard]] Status scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                    const std::uint64_t* inputs, std::uint32_t inputCount,
                                    std::uint64_t* outputs, std::uint32_t* outputCount) override;
    [[nodiscard]] Status post(ConnectionHandle connection, std::uint32_t selector,
                              const void* input, std::size_t inputSize) override;
    [[nodiscard]] bool isConnected(ConnectionHandle connection) const override;

    void setDeadline(std::optional<Deadline> deadline) noexcept override;
    [[nodiscard]] bool isInherited() const noexcept override;
    void leaveToParent() noexcept override;

  private:
    /// A connection on which every request but the first needs the service to be open.
    class Opened final : public KernelSocketConnection {
      public:
        Opened(const std::optional<base::UnixAddress>& address, SystemLog& log,
               std::chrono::milliseconds timeout, std::string_view program, std::uint32_t type,
               const RegistryPath& path)
            : KernelSocketConnection(address, log, timeout, program), type_(type), path_(path) {}

        /// Its handle means nothing any more.
        bool leftToParent = false;

      private:
        /// Sent again on every fresh connection, so that a kernel side that was restarted is open
        /// too.
        [[nodiscard]] Status greet() override;

        std::uint32_t type_;
        RegistryPath path_;
    };

    [[nodiscard]] const Opened* find(ConnectionHandle connection) const;
    [[nodiscard]] Opened* find(ConnectionHandle connection);

    std::optional<base::UnixAddress> address_;
    const LinuxServiceRegistry& registry_;
    SystemLog& log_;
    std::chrono::milliseconds timeout_;
    std::optional<Deadline> deadline_;
    std::array<std::optional<Opened>, kMaxConnections> connections_;
};

} // namespace platform
