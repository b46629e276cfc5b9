#include "platform/linux/LinuxServiceRegistry.h"

#include "platform/linux/AsBytes.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <utility>

namespace platform {

std::optional<RegistryPath> RegistryPath::of(std::string_view text) {
    RegistryPath path;
    if (text.empty() || text.size() > path.text_.size()) {
        return std::nullopt;
    }
    path.size_ = text.copy(path.text_.data(), path.text_.size());
    return path;
}

LinuxServiceRegistry::LinuxServiceRegistry(std::string_view socketPath, SystemLog& log,
                                           std::chrono::milliseconds timeout)
    : log_(log), connection_(socketPath, log, timeout) {}

ServiceHandle LinuxServiceRegistry::findByPath(std::string_view path) {
    return path.size() > wire::kKernelMaxPathLength ? kNoService
                                                    : find(wire::KernelOperation::findByPath, path);
}

ServiceHandle LinuxServiceRegistry::findByClassName(std::string_view name) {
    return name.size() > wire::kKernelMaxNameLength
               ? kNoService
               : find(wire::KernelOperation::findByClassName, name);
}

ServiceHandle LinuxServiceRegistry::find(wire::KernelOperation operation, std::string_view key) {
    KernelSocketConnection::Reply reply;
    Outcome outcome = connection_.exchange(operation, {asBytes(key)}, reply);
    if (outcome == kSuccess) {
        outcome = reply.status;
    }
    if (outcome == kSuccess && reply.reported == 0) {
        outcome = kNoEntry;
    }
    std::optional<RegistryPath> path;
    if (outcome == kSuccess) {
        path =
            RegistryPath::of({reinterpret_cast<const char*>(reply.body.data()), reply.body.size()});
        if (!path) {
            connection_.disconnect();
            outcome = statusFromErrno(EPROTO);
        }
    }
    tell("find", key, outcome, lastFind_);
    return path ? hold(*path) : kNoService;
}

ServiceHandle LinuxServiceRegistry::hold(const RegistryPath& path) {
    std::optional<Entry>* room = nullptr;
    for (auto& entry : entries_) {
        if (!entry) {
            room = &entry;
        } else if (entry->path.text() == path.text()) {
            ++entry->references;
            return entry->handle;
        }
    }
    if (room == nullptr) {
        return kNoService;
    }
    room->emplace(Entry{++lastHandle_, 1, path});
    return lastHandle_;
}

std::optional<std::vector<std::uint8_t>> LinuxServiceRegistry::copyProperty(ServiceHandle entry,
                                                                            std::string_view name) {
    const std::string_view path = pathOf(entry);
    if (path.empty() || name.empty() || name.size() > wire::kKernelMaxNameLength) {
        return std::nullopt;
    }
    const auto prefix = wire::encodeKernelPropertyPrefix(path.size());
    KernelSocketConnection::Reply reply;
    Outcome outcome = connection_.exchange(wire::KernelOperation::copyProperty,
                                           {prefix, asBytes(path), asBytes(name)}, reply);
    if (outcome == kSuccess) {
        outcome = reply.status;
    }
    tell("copy", name, outcome, lastCopy_);
    if (outcome != kSuccess || reply.reported == 0) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(reply.body.begin(), reply.body.end());
}

/// The line is made on the stack: a client may have no memory left.
void LinuxServiceRegistry::tell(const char* what, std::string_view name, Outcome outcome,
                                Outcome& last) {
    if (outcome == std::exchange(last, outcome) || outcome == kSuccess) {
        return;
    }
    std::array<char, 32> number{};
    const char* reason = number.data();
    if (outcome == kNoEntry) {
        reason = "there is none";
    } else if (const int error = errnoFromStatus(outcome); error != 0) {
        reason = ::strerrordesc_np(error);
    } else {
        static_cast<void>(
            std::snprintf(number.data(), number.size(), "refused with status %d", outcome));
    }
    constexpr std::size_t kMaxNameLength = wire::kKernelMaxNameLength;
    std::array<char, kMaxNameLength + 128> line;
    const int length = std::snprintf(
        line.data(), line.size(), "kstd: ServiceRegistry: cannot %s %.*s: %s.\n", what,
        static_cast<int>(std::min(name.size(), kMaxNameLength)), name.data(), reason);
    log_.write(LogLevel::warning, {line.data(), static_cast<std::size_t>(length)}, {});
}

void LinuxServiceRegistry::release(ServiceHandle entry) {
    for (auto& held : entries_) {
        if (held && held->handle == entry && --held->references == 0) {
            held.reset();
        }
    }
}

void LinuxServiceRegistry::setDeadline(std::optional<Deadline> deadline) noexcept {
    connection_.setDeadline(deadline);
}

std::string_view LinuxServiceRegistry::pathOf(ServiceHandle entry) const {
    for (const auto& held : entries_) {
        if (held && held->handle == entry) {
            return held->path.text();
        }
    }
    return {};
}

} // namespace platform
