#include "platform/linux/LinuxServiceRegistry.h"

#include "platform/linux/AsBytes.h"

#include <utility>

namespace platform {

LinuxServiceRegistry::LinuxServiceRegistry(const std::string& socketPath, SystemLog& log,
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
    const std::string path(reply.body.begin(), reply.body.end());
    const bool isPath = !path.empty() && path.size() <= wire::kKernelMaxPathLength;
    return isPath ? hold(path) : kNoService;
}

ServiceHandle LinuxServiceRegistry::hold(std::string path) {
    for (auto& [handle, entry] : entries_) {
        if (entry.path == path) {
            ++entry.references;
            return handle;
        }
    }
    entries_.emplace(++lastHandle_, Entry{std::move(path), 1});
    return lastHandle_;
}

std::optional<std::vector<std::uint8_t>> LinuxServiceRegistry::copyProperty(ServiceHandle entry,
                                                                            std::string_view name) {
    const std::string path = pathOf(entry);
    if (path.empty() || name.empty() || name.size() > wire::kKernelMaxNameLength) {
        return std::nullopt;
    }
    const auto request = wire::encodeKernelProperty({path, name});
    KernelSocketConnection::Reply reply;
    if (connection_.exchange(wire::KernelOperation::copyProperty, {request}, reply) != kSuccess ||
        reply.status != kSuccess || reply.reported == 0) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(reply.body.begin(), reply.body.end());
}

void LinuxServiceRegistry::release(ServiceHandle entry) {
    const auto found = entries_.find(entry);
    if (found != entries_.end() && --found->second.references == 0) {
        entries_.erase(found);
    }
}

std::string LinuxServiceRegistry::pathOf(ServiceHandle entry) const {
    const auto found = entries_.find(entry);
    return found == entries_.end() ? std::string() : found->second.path;
}

} // namespace platform
