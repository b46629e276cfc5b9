#pragma once

#include <chrono>
#include <optional>

namespace platform {

/// What the registry and the channel have in common, whose requests go to the kernel service: how
/// long they may take together, and the process that the connections belong to.
///
/// A double that has neither time nor connections leaves these operations as they are.
class KernelConnections {
  public:
    using Deadline = std::chrono::steady_clock::time_point;

    KernelConnections() = default;
    KernelConnections(const KernelConnections&) = delete;
    KernelConnections& operator=(const KernelConnections&) = delete;
    virtual ~KernelConnections() = default;

    /// Until when everything that is sent from now on must be answered; what is not fails with the
    /// status of ETIMEDOUT. None, as at first: each request has the whole time limit for itself.
    virtual void setDeadline(std::optional<Deadline> /*deadline*/) noexcept {}

    /// Whether a connection was made by another process, of which this one is a child.
    [[nodiscard]] virtual bool isInherited() const noexcept { return false; }

    /// To be called in a child process: gives up the connections of the parent, to which nothing
    /// is sent and nothing happens. Does only what a child of a process with several threads may.
    virtual void leaveToParent() noexcept {}
};

} // namespace platform
