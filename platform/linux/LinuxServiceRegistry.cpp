#include "platform/linux/LinuxServiceRegistry.h"

#include "platform/linux/AsBytes.h"

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
    : connection_(socketPath, log, timeout) {}

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
    if (connection_.exchange(operation, {asBytes(key)}, reply) != kSuccess ||
        reply.status != kSuccess || reply.reported == 0) {
        return kNoService;
    }
    const auto path =
        RegistryPath::of({reinterpret_cast<const char*>(reply.body.data()), reply.body.size()});
    if (!path) {
        connection_.disconnect();
        return kNoService;
    }
    return hold(*path);
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
    if (connection_.exchange(wire::KernelOperation::copyProperty,
                             {prefix, asBytes(path), asBytes(name)}, reply) != kSuccess ||
        reply.status != kSuccess || reply.reported == 0) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(reply.body.begin(), reply.body.end());
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
