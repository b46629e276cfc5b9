#include "platform/linux/SettingsWatch.h"

#include "base/Concat.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <sys/inotify.h>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

// A write is told when the file is closed, so that no half-written file is read because of it.
constexpr std::uint32_t kFileChanges =
    IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_ATTRIB | IN_ONLYDIR;
constexpr std::uint32_t kDirectoryChanges = IN_CREATE | IN_MOVED_TO | IN_ONLYDIR;
constexpr std::size_t kBufferSize = 4096;

} // namespace

SettingsWatch::SettingsWatch(const std::string& path, LinuxRunLoop& loop, SystemLog& log,
                             Changed changed)
    : directory_(std::filesystem::path(path).parent_path().string()),
      directoryName_(std::filesystem::path(directory_).filename().string()),
      fileName_(std::filesystem::path(path).filename().string()),
      changed_(std::move(changed)),
      inotify_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
    const std::string parent = std::filesystem::path(directory_).parent_path().string();
    parentWatch_ = ::inotify_add_watch(inotify_.get(), parent.c_str(), kDirectoryChanges);
    watchDirectory();
    if (parentWatch_ < 0 && directoryWatch_ < 0) {
        log.write(LogLevel::warning,
                  base::concat("kstd: SettingsWatch: cannot watch ", directory_, ", error ", errno,
                               "; changes are seen at the next start.\n"),
                  {});
        return;
    }
    source_ = loop.addReadable(inotify_.get(), [this] { readEvents(); });
}

void SettingsWatch::watchDirectory() {
    directoryWatch_ = ::inotify_add_watch(inotify_.get(), directory_.c_str(), kFileChanges);
}

bool SettingsWatch::concernsFile(int watch, std::string_view name) {
    if (watch == parentWatch_ && name == directoryName_) {
        watchDirectory();
        return true;
    }
    return watch == directoryWatch_ && name == fileName_;
}

void SettingsWatch::readEvents() {
    alignas(inotify_event) std::array<char, kBufferSize> buffer{};
    const ssize_t length = ::read(inotify_.get(), buffer.data(), buffer.size());
    bool changed = false;
    std::size_t offset = 0;
    while (length > 0 && offset < static_cast<std::size_t>(length)) {
        inotify_event event{};
        std::memcpy(&event, buffer.data() + offset, sizeof event);
        const char* const name = buffer.data() + offset + sizeof event;
        // What was lost in an overflow may have been a change.
        changed |= (event.mask & IN_Q_OVERFLOW) != 0;
        changed |= concernsFile(event.wd, event.len > 0 ? std::string_view(name) : "");
        offset += sizeof event + event.len;
    }
    if (changed) {
        changed_();
    }
}

} // namespace platform
