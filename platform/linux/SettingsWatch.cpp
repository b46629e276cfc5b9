#include "platform/linux/SettingsWatch.h"

#include "base/Concat.h"
#include "base/FileNames.h"
#include "platform/MessageClasses.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstring>
#include <optional>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

// A write is told when the file is closed, so that no half-written file is read because of it.
constexpr std::uint32_t kChanges =
    IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_ATTRIB | IN_CREATE | IN_ONLYDIR;
constexpr std::size_t kBufferSize = 4096;
/// As many as the system follows.
constexpr int kMaxLinks = 40;

/// Where a link leads; none when the path is no link, or when that cannot be known, with `error`.
std::optional<std::string> targetOf(const std::string& path, int& error) {
    std::array<char, PATH_MAX> target{};
    const ssize_t length = ::readlink(path.c_str(), target.data(), target.size());
    // What is no link is refused as an argument.
    const bool isKnown = length >= 0 || errno == EINVAL || errno == ENOENT || errno == ENOTDIR;
    error = isKnown ? 0 : errno;
    return length < 0 ? std::nullopt
                      : std::optional(std::string(target.data(), static_cast<std::size_t>(length)));
}

/// The first name of a way, which is taken off; empty when there is none.
std::string takeName(std::string& way) {
    const std::size_t begin = way.find_first_not_of('/');
    const std::size_t end = begin == std::string::npos ? begin : way.find('/', begin);
    std::string name = begin == std::string::npos ? "" : way.substr(begin, end - begin);
    way.erase(0, end);
    return name;
}

/// Whether what was made is there as a whole: a file that is to be written is not.
bool isWhole(const std::string& path) {
    struct stat status {};
    return ::lstat(path.c_str(), &status) == 0 && (!S_ISREG(status.st_mode) || status.st_nlink > 1);
}

} // namespace

SettingsWatch::SettingsWatch(const std::string& path, LinuxRunLoop& loop, SystemLog& log,
                             Changed changed)
    : log_(log), changed_(std::move(changed)), inotify_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
    const std::string directory = base::directoryOf(path);
    start_ = base::directoryOf(directory);
    way_ = path.substr(start_.size());
    if (!inotify_.isOpen()) {
        sayThatItCannotWatch(directory, errno);
        return;
    }
    watchTheWay();
    if (!watches_.empty()) {
        source_ = loop.addReadable(inotify_.get(), [this] { readEvents(); });
    }
}

void SettingsWatch::watchTheWay() {
    const Watches before = std::exchange(watches_, addWatches());
    for (const auto& [watch, names] : before) {
        if (!watches_.contains(watch)) {
            ::inotify_rm_watch(inotify_.get(), watch);
            directories_.erase(watch);
        }
    }
}

/// Each directory is watched before it is looked at, so that no change falls between the two.
SettingsWatch::Watches SettingsWatch::addWatches() {
    Watches added;
    std::string directory = start_;
    std::string way = way_;
    int links = 0;
    while (links <= kMaxLinks) {
        const std::string name = takeName(way);
        if (name.empty()) {
            break;
        }
        if (name == "." || name == "..") {
            directory = base::concat(directory, '/', name);
            continue;
        }
        const int watch = ::inotify_add_watch(inotify_.get(), directory.c_str(), kChanges);
        if (watch < 0) {
            if (added.empty() || (errno != ENOENT && errno != ENOTDIR)) {
                sayThatItCannotWatch(directory, errno);
                return added;
            }
            // The rest of the way is not there yet.
            break;
        }
        added[watch].insert(name);
        directories_.insert_or_assign(watch, directory);
        const std::string path = base::concat(directory, '/', name);
        int error = 0;
        const auto target = targetOf(path, error);
        if (error != 0) {
            sayThatItCannotWatch(path, error);
            return added;
        }
        if (target) {
            ++links;
            directory = target->starts_with('/') ? "/" : directory;
            way = base::concat(*target, '/', way);
        } else {
            directory = path;
        }
    }
    said_.clear();
    return added;
}

bool SettingsWatch::isChange(int watch, std::uint32_t what, std::string_view name) const {
    const auto found = watches_.find(watch);
    if (found == watches_.end() || !found->second.contains(name)) {
        return false;
    }
    return (what & IN_CREATE) == 0 || isWhole(base::concat(directories_.at(watch), '/', name));
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
        changed |= isChange(event.wd, event.mask, event.len > 0 ? std::string_view(name) : "");
        offset += sizeof event + event.len;
    }
    if (changed) {
        watchTheWay();
        changed_();
    }
}

/// Once until it went well.
void SettingsWatch::sayThatItCannotWatch(const std::string& directory, int error) {
    const std::string line = base::concat("kstd: SettingsWatch: cannot watch ", directory, ": ",
                                          std::generic_category().message(error),
                                          "; changes are seen at the next start.\n");
    if (std::exchange(said_, line) != line) {
        log_.write(LogLevel::warning, line, {.messageId = message::kSettingsNotWatched});
    }
}

} // namespace platform
