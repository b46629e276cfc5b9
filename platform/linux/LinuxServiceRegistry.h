#pragma once

#include "platform/ServiceRegistry.h"
#include "platform/linux/KernelSocketConnection.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace platform {

/// The path of an entry, in no memory but its own.
class RegistryPath {
  public:
    /// None when it is empty or longer than a path can be.
    [[nodiscard]] static std::optional<RegistryPath> of(std::string_view text);

    [[nodiscard]] std::string_view text() const { return {text_.data(), size_}; }

    bool operator==(const RegistryPath& other) const { return text() == other.text(); }

  private:
    RegistryPath() = default;

    // As long as its size says; the rest is not looked at.
    std::array<char, wire::kKernelMaxPathLength> text_;
    std::size_t size_ = 0;
};

/// ServiceRegistry over the kernel service's socket. Only a property is allocated.
///
/// What cannot be found or copied leaves a warning with the socket's path and the reason, under the
/// program's name: what the system says when the kernel service is not reached or does not answer,
/// or what the service says. A reason is told once, until the same works again. That there is no
/// such property is no failure.
class LinuxServiceRegistry final : public ServiceRegistry {
  public:
    /// How many entries are held at the same time. One more takes the place of the one that was
    /// found the longest ago, whose handle is then not held any more: a kernel side that is
    /// somewhere else at every look must not use them up, because a library that cannot open what
    /// it has found keeps it.
    static constexpr std::size_t kMaxEntries = 16;

    LinuxServiceRegistry(std::string_view socketPath, SystemLog& log,
                         std::chrono::milliseconds timeout = kKernelTimeout,
                         std::string_view program = kDaemonName);

    [[nodiscard]] ServiceHandle findByPath(std::string_view path) override;
    [[nodiscard]] ServiceHandle findByClassName(std::string_view name) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>>
    copyProperty(ServiceHandle entry, std::string_view name) override;
    void release(ServiceHandle entry) override;

    void setDeadline(std::optional<Deadline> deadline) noexcept override;
    [[nodiscard]] bool isInherited() const noexcept override { return connection_.isInherited(); }
    void leaveToParent() noexcept override { connection_.leaveToParent(); }

    /// The registry path of an entry that is held, or an empty text. Stands until it is released.
    [[nodiscard]] std::string_view pathOf(ServiceHandle entry) const;

    /// Why the kernel service could not be asked when this entry was found last; 0 when it was, or
    /// when the entry is not held.
    [[nodiscard]] Status statusOf(ServiceHandle entry) const;

    /// Whose lines the registry's are.
    [[nodiscard]] std::string_view program() const { return connection_.program(); }

  private:
    struct Entry {
        ServiceHandle handle;
        std::uint64_t references;
        /// None when the kernel service could not be asked for it.
        std::optional<RegistryPath> path;
        Status status;
        /// A number that grows.
        std::uint64_t found;
    };

    /// How a request ended: as a status, or with no entry of that name.
    using Outcome = Status;
    static constexpr Outcome kNoEntry = kPlatformStatusBase;

    /// What became of a lookup; with a path when the entry was found.
    struct Lookup {
        Outcome outcome;
        std::optional<RegistryPath> path = std::nullopt;
    };

    [[nodiscard]] Lookup lookUp(wire::KernelOperation operation, std::string_view key);
    /// Whether a lookup that failed says that the kernel service is there and could not be asked.
    [[nodiscard]] static bool isWithheld(Outcome outcome);
    [[nodiscard]] ServiceHandle hold(const std::optional<RegistryPath>& path, Status status);
    [[nodiscard]] const Entry* find(ServiceHandle entry) const;

    /// Tells of a failure that is not the last one of its kind.
    void tell(const char* what, std::string_view name, Outcome outcome, Outcome& last);

    SystemLog& log_;
    KernelSocketConnection connection_;
    Outcome lastFind_ = kSuccess;
    Outcome lastCopy_ = kSuccess;
    std::array<std::optional<Entry>, kMaxEntries> entries_;
    ServiceHandle lastHandle_ = kNoService;
    std::uint64_t lastFound_ = 0;
};

} // namespace platform
