#include "platform/linux/LinuxServiceRegistry.h"

#include "platform/MessageClasses.h"
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
                                           std::chrono::milliseconds timeout,
                                           std::string_view program)
    : log_(log), connection_(socketPath, log, timeout, program) {}

ServiceHandle LinuxServiceRegistry::findByPath(std::string_view path) {
    if (path.size() > wire::kKernelMaxPathLength) {
        return kNoService;
    }
    const Lookup found = lookUp(wire::KernelOperation::findByPath, path);
    return found.path ? hold(found.path, kSuccess) : kNoService;
}

ServiceHandle LinuxServiceRegistry::findByClassName(std::string_view name) {
    if (name.size() > wire::kKernelMaxNameLength) {
        return kNoService;
    }
    const Lookup found = lookUp(wire::KernelOperation::findByClassName, name);
    // What is withheld is held, too: who opens it is told why.
    return found.path || isWithheld(found.outcome) ? hold(found.path, found.outcome) : kNoService;
}

bool LinuxServiceRegistry::isWithheld(Outcome outcome) {
    return outcome != kNoEntry && outcome != statusFromErrno(ENOENT) &&
           outcome != statusFromErrno(ENOTDIR);
}

LinuxServiceRegistry::Lookup LinuxServiceRegistry::lookUp(wire::KernelOperation operation,
                                                          std::string_view key) {
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
    return {outcome, path};
}

ServiceHandle LinuxServiceRegistry::hold(const std::optional<RegistryPath>& path, Status status) {
    std::optional<Entry>* room = &entries_.front();
    for (auto& entry : entries_) {
        if (entry && entry->path == path) {
            ++entry->references;
            entry->status = status;
            entry->found = ++lastFound_;
            return entry->handle;
        }
        if (*room && (!entry || entry->found < (*room)->found)) {
            room = &entry;
        }
    }
    // No handle comes again, so that one that was released or gave way is never another's.
    room->emplace(Entry{++lastHandle_, 1, path, status, ++lastFound_});
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
    // Once for each change. That there is no connection was told by the connection.
    if (outcome == std::exchange(last, outcome) || outcome == kSuccess ||
        outcome == connection_.connectStatus()) {
        return;
    }
    std::array<char, 32> number{};
    const char* reason = nullptr;
    if (outcome == kNoEntry) {
        reason = "there is none";
    } else if (const int error = errnoFromStatus(outcome); error != 0) {
        reason = ::strerrordesc_np(error);
    }
    // A kernel side may also say a number that looks like an error of the system and is none.
    if (reason == nullptr) {
        reason = number.data();
        static_cast<void>(
            std::snprintf(number.data(), number.size(), "refused with status %d", outcome));
    }
    constexpr std::size_t kMaxNameLength = wire::kKernelMaxNameLength;
    std::array<char, 2 * kMaxNameLength + 256> line;
    const std::string_view program = connection_.program();
    const std::string_view path = connection_.path();
    const int length = std::snprintf(
        line.data(), line.size(), "%.*s: ServiceRegistry: cannot %s %.*s at %.*s: %s.\n",
        static_cast<int>(program.size()), program.data(), what,
        static_cast<int>(std::min(name.size(), kMaxNameLength)), name.data(),
        static_cast<int>(path.size()), path.data(), reason);
    const auto written = std::min(static_cast<std::size_t>(std::max(length, 0)), line.size() - 1);
    log_.write(LogLevel::warning, {line.data(), written},
               {.messageId = message::kKernelServiceFailed});
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

const LinuxServiceRegistry::Entry* LinuxServiceRegistry::find(ServiceHandle entry) const {
    const auto* const held =
        std::find_if(entries_.begin(), entries_.end(),
                     [entry](const auto& place) { return place && place->handle == entry; });
    return held == entries_.end() ? nullptr : &**held;
}

std::string_view LinuxServiceRegistry::pathOf(ServiceHandle entry) const {
    const Entry* const held = find(entry);
    return held != nullptr && held->path ? held->path->text() : std::string_view();
}

Status LinuxServiceRegistry::statusOf(ServiceHandle entry) const {
    const Entry* const held = find(entry);
    return held != nullptr ? held->status : kSuccess;
}

} // namespace platform
