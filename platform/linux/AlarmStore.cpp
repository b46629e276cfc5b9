#include "platform/linux/AlarmStore.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <fcntl.h>
#include <filesystem>
#include <optional>
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
    return !name.empty() && name.size() <= kMaxNameLength && name != "." && name != ".." &&
           name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

std::string lineFor(Date date) {
    const std::string digits = base::concat(std::max<std::int64_t>(date.nanosecondsSince1970, 0));
    return base::concat(std::string(kDigits - digits.size(), '0'), digits, '\n');
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

std::string readLine(const std::string& path) {
    const base::FileDescriptor file(
        ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    std::string text(kLineSize + 1, '\0');
    const ssize_t length = file.isOpen() ? ::read(file.get(), text.data(), text.size()) : 0;
    text.resize(length > 0 ? static_cast<std::size_t>(length) : 0);
    return text;
}

bool writeAt0(int descriptor, std::string_view bytes) {
    off_t offset = 0;
    while (!bytes.empty()) {
        const ssize_t count = ::pwrite(descriptor, bytes.data(), bytes.size(), offset);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return false;
        }
        offset += count;
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
}

/// Makes the file hold just the line, on permanent storage.
bool writeLine(int descriptor, std::string_view line) {
    struct stat status {};
    if (!writeAt0(descriptor, line) || ::fstat(descriptor, &status) != 0) {
        return false;
    }
    const bool isLonger = status.st_size > static_cast<off_t>(line.size());
    return (!isLonger || ::ftruncate(descriptor, static_cast<off_t>(line.size())) == 0) &&
           ::fdatasync(descriptor) == 0;
}

bool syncDirectory(const std::string& path) {
    const base::FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return directory.isOpen() && ::fsync(directory.get()) == 0;
}

std::string parentOf(const std::string& path) {
    return std::filesystem::path(path).parent_path().string();
}

/// Fails with ENOENT when there is no such file.
bool overwrite(const std::string& path, std::string_view line) {
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags));
    return file.isOpen() && writeLine(file.get(), line);
}

bool make(const std::string& path, std::string_view line) {
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags | O_CREAT, kFileMode));
    return file.isOpen() && writeLine(file.get(), line) && syncDirectory(parentOf(path));
}

} // namespace

AlarmStore::AlarmStore(std::string directory, SystemLog& log)
    : directory_(std::move(directory)), log_(log) {}

std::vector<std::pair<std::string, Date>> AlarmStore::load(std::string_view stream) {
    std::vector<std::pair<std::string, Date>> alarms;
    std::error_code error;
    const std::string directory = base::concat(directory_, '/', stream);
    for (const auto& entry : std::filesystem::directory_iterator(directory, error)) {
        const std::string path = entry.path().string();
        const Line line = parse(readLine(path));
        if (!line.readable) {
            report("unreadable alarm, taken as due", path, 0);
        }
        if (line.readable && !line.date) {
            known_.insert_or_assign(path, std::nullopt);
        } else {
            alarms.emplace_back(entry.path().filename().string(), line.date.value_or(Date{}));
        }
    }
    return alarms;
}

void AlarmStore::save(std::string_view stream, std::string_view event, Date date) {
    if (!isFileName(stream) || !isFileName(event)) {
        report("alarm whose name cannot be kept on disk", event, 0);
        return;
    }
    const std::string directory = base::concat(directory_, '/', stream);
    const std::string path = base::concat(directory, '/', event);
    if (knows(path, date)) {
        return;
    }
    const std::string line = lineFor(date);
    if (overwrite(path, line) ||
        (errno == ENOENT && makeDirectory(directory) && make(path, line))) {
        known_.insert_or_assign(path, date);
        return;
    }
    report("cannot keep the alarm on disk", path, errno);
    known_.erase(path);
}

void AlarmStore::clear(std::string_view stream, std::string_view event) {
    const std::string path = base::concat(directory_, '/', stream, '/', event);
    if (!isFileName(stream) || !isFileName(event) || knows(path, std::nullopt)) {
        return;
    }
    const base::FileDescriptor file(::open(path.c_str(), kWriteFlags));
    const bool isMissing = !file.isOpen() && errno == ENOENT;
    if (isMissing || (file.isOpen() && writeAt0(file.get(), kCancelled) &&
                      ::ftruncate(file.get(), kLineSize) == 0)) {
        known_.insert_or_assign(path, std::nullopt);
        return;
    }
    report("cannot cancel the alarm on disk", path, errno);
    known_.erase(path);
}

bool AlarmStore::knows(const std::string& path, std::optional<Date> date) const {
    const auto known = known_.find(path);
    return known != known_.end() && known->second == date;
}

bool AlarmStore::makeDirectory(const std::string& path) {
    if (::mkdir(path.c_str(), kDirectoryMode) == 0) {
        return syncDirectory(parentOf(path));
    }
    if (errno == EEXIST) {
        return true;
    }
    return errno == ENOENT && path.size() > 1 && makeDirectory(parentOf(path)) &&
           ::mkdir(path.c_str(), kDirectoryMode) == 0 && syncDirectory(parentOf(path));
}

void AlarmStore::report(std::string_view what, std::string_view path, int error) const {
    log_.write(LogLevel::warning,
               error == 0
                   ? base::concat("kstd: AlarmStore: ", what, ": ", path, ".\n")
                   : base::concat("kstd: AlarmStore: ", what, ": ", path, ", error ", error, ".\n"),
               {});
}

} // namespace platform
