#include "platform/linux/alarms/AlarmStore.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/FileNames.h"
#include "platform/MessageClasses.h"
#include "platform/linux/Paths.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace platform {

namespace {

constexpr std::size_t kDigits = 20;
constexpr std::size_t kLineSize = kDigits + 1;
constexpr std::string_view kCancelled = "none                \n";
static_assert(kCancelled.size() == kLineSize);
constexpr int kWriteFlags = O_WRONLY | O_CLOEXEC | O_NOFOLLOW;
constexpr mode_t kFileMode = 0600;
constexpr mode_t kDirectoryMode = 0700;
constexpr std::size_t kMaxNameLength = 200;

/// Whether a name can be that of a file in a directory.
bool isFileName(std::string_view name) {
    return name.size() <= kMaxNameLength && isPlainFileName(name);
}

std::string lineFor(Date date) {
    const std::string digits = base::concat(std::max<std::int64_t>(date.nanosecondsSince1970, 0));
    return base::concat(std::string(kDigits - digits.size(), '0'), digits, '\n');
}

std::string reasonOf(int error) {
    return std::generic_category().message(error);
}

struct Line {
    bool readable = false;
    std::optional<Date> date;
};

Line parse(std::string_view text) {
    if (text == kCancelled) {
        return {true, std::nullopt};
    }
    std::int64_t nanoseconds = 0;
    const char* const end = text.data() + kDigits;
    if (text.size() != kLineSize || text.back() != '\n') {
        return {};
    }
    const auto result = std::from_chars(text.data(), end, nanoseconds);
    if (result.ec != std::errc() || result.ptr != end || nanoseconds < 0) {
        return {};
    }
    return {true, Date{nanoseconds}};
}

struct Text {
    std::string bytes;
    /// For which there are none, or 0.
    int error = 0;
};

Text readLine(const std::string& path) {
    // Not blocking, because opening a pipe would wait for its writer.
    const base::FileDescriptor file(
        ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    // A byte more than a line has, by which a file that goes on behind it is known.
    std::string text(kLineSize + 1, '\0');
    const ssize_t length = file.isOpen() ? ::read(file.get(), text.data(), text.size()) : -1;
    if (length < 0) {
        return {{}, errno};
    }
    text.resize(static_cast<std::size_t>(length));
    return {text};
}

// What follows gives 0, or the error for which it did not succeed.

int writeAt0(int descriptor, std::string_view bytes) {
    off_t offset = 0;
    while (!bytes.empty()) {
        const ssize_t count = ::pwrite(descriptor, bytes.data(), bytes.size(), offset);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return count < 0 ? errno : EIO;
        }
        offset += count;
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return 0;
}

int errorUnless(bool succeeded) {
    return succeeded ? 0 : errno;
}

/// Makes the file hold just the line.
int writeLine(int descriptor, std::string_view line) {
    if (const int error = writeAt0(descriptor, line); error != 0) {
        return error;
    }
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        return errno;
    }
    const auto size = static_cast<off_t>(line.size());
    // Cut after the write, so that the file is at no time without a line.
    return status.st_size > size ? errorUnless(::ftruncate(descriptor, size) == 0) : 0;
}

int writeDurably(int descriptor, std::string_view line) {
    const int error = writeLine(descriptor, line);
    return error != 0 ? error : errorUnless(::fdatasync(descriptor) == 0);
}

int syncDirectory(const std::string& path) {
    const base::FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return errorUnless(directory.isOpen() && ::fsync(directory.get()) == 0);
}

int makeDirectory(const std::string& path) {
    const std::string parent = base::directoryOf(path);
    int error = errorUnless(::mkdir(path.c_str(), kDirectoryMode) == 0);
    if (error == ENOENT && parent != path) {
        error = makeDirectory(parent);
        error = error != 0 ? error : errorUnless(::mkdir(path.c_str(), kDirectoryMode) == 0);
    }
    return error == 0 || error == EEXIST ? syncDirectory(parent) : error;
}

/// Puts the file's name on disk, and that of its directory. Who made them may have ended before
/// that.
int syncName(const std::string& path) {
    const std::string directory = base::directoryOf(path);
    const int error = syncDirectory(directory);
    return error != 0 ? error : syncDirectory(base::directoryOf(directory));
}

/// Fails with ENOENT when there is no such file.
int overwrite(const std::string& path, std::string_view line) {
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags));
    return file.isOpen() ? writeDurably(file.get(), line) : errno;
}

int make(const std::string& path, std::string_view line) {
    if (const int error = makeDirectory(base::directoryOf(path)); error != 0) {
        return error;
    }
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags | O_CREAT, kFileMode));
    return file.isOpen() ? writeDurably(file.get(), line) : errno;
}

int cancel(const std::string& path) {
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags));
    if (!file.isOpen()) {
        return errno == ENOENT ? 0 : errno;
    }
    return writeLine(file.get(), kCancelled);
}

/// None have been registered where there is no directory.
int listNames(const std::string& directory, std::vector<std::string>& names) {
    // Not std::filesystem, whose iterator throws when it goes on, whatever it was made with.
    DIR* const listing = ::opendir(directory.c_str());
    if (listing == nullptr) {
        return errno == ENOENT ? 0 : errno;
    }
    errno = 0;
    while (const dirent* const entry = ::readdir(listing)) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") {
            names.emplace_back(name);
        }
        errno = 0;
    }
    const int error = errno;
    ::closedir(listing);
    return error;
}

} // namespace

AlarmStore::AlarmStore(std::string directory, std::vector<std::string> events, SystemLog& log)
    : directory_(std::move(directory)), events_(std::move(events)), log_(log) {}

std::vector<std::pair<std::string, Date>> AlarmStore::load(std::string_view stream) {
    std::vector<std::pair<std::string, Date>> alarms;
    const std::string directory = base::concat(directory_, '/', stream);
    std::vector<std::string> names;
    if (const int error = listNames(directory, names); error != 0) {
        report("unreadable directory, every alarm taken as due", directory, reasonOf(error));
        for (const std::string& event : events_) {
            alarms.emplace_back(event, Date{});
        }
        return alarms;
    }
    for (const std::string& event : names) {
        const std::string path = pathOf(stream, event);
        if (!isAlarm(event)) {
            report("no alarm of the daemon, left alone", path, {});
            continue;
        }
        const Text text = readLine(path);
        const Line line = parse(text.bytes);
        if (!line.readable) {
            report("unreadable alarm, taken as due", path,
                   text.error != 0 ? reasonOf(text.error) : std::string());
        }
        if (line.readable && !line.date) {
            known_.insert_or_assign(path, std::nullopt);
        } else {
            alarms.emplace_back(event, line.date.value_or(Date{}));
        }
    }
    return alarms;
}

bool AlarmStore::save(std::string_view stream, std::string_view event, Date date) {
    const std::string path = pathOf(stream, event);
    if (knows(path, date)) {
        return true;
    }
    if (!isAlarm(event) || !isFileName(stream)) {
        return failToSave(path, "no alarm has such a name");
    }
    const std::string line = lineFor(date);
    int error = overwrite(path, line);
    if (error == ENOENT) {
        syncedNames_.erase(path);
        error = make(path, line);
    }
    if (error == 0 && !syncedNames_.contains(path)) {
        error = syncName(path);
    }
    if (error != 0) {
        return failToSave(path, reasonOf(error));
    }
    syncedNames_.insert(path);
    known_.insert_or_assign(path, date);
    reported_.erase(path);
    return true;
}

bool AlarmStore::failToSave(const std::string& path, const std::string& reason) {
    report("cannot keep the alarm on disk", path, reason);
    reasons_.insert_or_assign(path, reason);
    known_.erase(path);
    return false;
}

void AlarmStore::clear(std::string_view stream, std::string_view event) {
    const std::string path = pathOf(stream, event);
    if (!isAlarm(event) || !isFileName(stream) || knows(path, std::nullopt)) {
        return;
    }
    if (const int error = cancel(path); error != 0) {
        report("cannot cancel the alarm on disk", path, reasonOf(error));
        known_.erase(path);
        return;
    }
    known_.insert_or_assign(path, std::nullopt);
    reported_.erase(path);
}

void AlarmStore::reportLost(std::string_view stream, std::string_view event) {
    const std::string path = pathOf(stream, event);
    log_.write(LogLevel::error,
               base::concat("kstd: AlarmStore: the alarm is lost until the kernel side sends it "
                            "again: ",
                            path, ": ", reasons_[path], ".\n"),
               {.messageId = message::kAlarmNotKept});
}

bool AlarmStore::isAlarm(std::string_view event) const {
    return isFileName(event) && std::find(events_.begin(), events_.end(), event) != events_.end();
}

std::string AlarmStore::pathOf(std::string_view stream, std::string_view event) const {
    return base::concat(directory_, '/', stream, '/', event);
}

bool AlarmStore::knows(const std::string& path, std::optional<Date> date) const {
    const auto known = known_.find(path);
    return known != known_.end() && known->second == date;
}

void AlarmStore::report(std::string_view what, const std::string& path, std::string_view reason) {
    const std::string line = base::concat("kstd: AlarmStore: ", what, ": ", path,
                                          reason.empty() ? "" : ": ", reason, ".\n");
    if (std::exchange(reported_[path], line) != line) {
        log_.write(LogLevel::warning, line, {.messageId = message::kAlarmNotKept});
    }
}

} // namespace platform
