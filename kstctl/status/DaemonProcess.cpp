#include "kstctl/status/DaemonProcess.h"

#include "base/Concat.h"
#include "kstctl/FileError.h"
#include "kstctl/status/BoundSockets.h"
#include "platform/linux/LinuxClock.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <string_view>
#include <unistd.h>

namespace kstctl {

namespace {

namespace fs = std::filesystem;

constexpr std::string_view kDaemonNames[] = {"kstd", "kstd-dev"};

/// What links in /proc call the sockets that are bound to the path.
std::set<std::string> linksToSockets(const std::string& path) {
    std::set<std::string> links;
    for (const BoundSocket& socket : socketsBoundTo(path)) {
        links.insert(base::concat("socket:[", socket.number, ']'));
    }
    return links;
}

std::string firstLine(const std::string& path) {
    std::ifstream file(path);
    std::string line;
    std::getline(file, line);
    return line;
}

bool isDaemon(const std::string& process) {
    const std::string name = firstLine(process + "/comm");
    return std::find(std::begin(kDaemonNames), std::end(kDaemonNames), name) !=
           std::end(kDaemonNames);
}

enum class Holds { no, yes, unknown };

Holds holdsOneOf(const std::string& process, const std::set<std::string>& sockets) {
    std::error_code error;
    for (fs::directory_iterator entry(process + "/fd", error), end; !error && entry != end;
         entry.increment(error)) {
        std::error_code gone;
        if (sockets.contains(fs::read_symlink(entry->path(), gone).string())) {
            return Holds::yes;
        }
    }
    return isRefusal(error.value()) ? Holds::unknown : Holds::no;
}

/// Field 22 of /proc/PID/stat, counted on from the name, which may hold anything.
std::optional<std::int64_t> startTicks(const std::string& process) {
    const std::string line = firstLine(process + "/stat");
    const std::size_t nameEnd = line.rfind(')');
    if (nameEnd == std::string::npos) {
        return std::nullopt;
    }
    std::istringstream words(line.substr(nameEnd + 1));
    std::string word;
    constexpr int kFieldsAfterName = 20;
    for (int field = 0; field < kFieldsAfterName; ++field) {
        words >> word;
    }
    std::int64_t ticks = 0;
    const auto result = std::from_chars(word.data(), word.data() + word.size(), ticks);
    return words && result.ec == std::errc() ? std::optional(ticks) : std::nullopt;
}

std::optional<platform::Date> startOf(const std::string& process) {
    const auto ticks = startTicks(process);
    const long ticksPerSecond = ::sysconf(_SC_CLK_TCK);
    timespec sinceBoot{};
    if (!ticks || ticksPerSecond <= 0 || ::clock_gettime(CLOCK_BOOTTIME, &sinceBoot) != 0) {
        return std::nullopt;
    }
    const std::int64_t upTime =
        sinceBoot.tv_sec * platform::kNanosecondsPerSecond + sinceBoot.tv_nsec;
    const std::int64_t age = upTime - *ticks * (platform::kNanosecondsPerSecond / ticksPerSecond);
    return platform::Date{platform::LinuxClock().now().nanosecondsSince1970 - age};
}

bool isProcess(const std::string& name) {
    return std::all_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; });
}

} // namespace

DaemonState findDaemonProcess(const std::string& path) {
    DaemonState state{.source = "process"};
    const std::set<std::string> sockets = linksToSockets(path);
    bool isDoubtful = false;
    std::error_code error;
    for (fs::directory_iterator entry("/proc", error), end; !error && entry != end;
         entry.increment(error)) {
        const std::string process = entry->path().string();
        const std::string name = entry->path().filename().string();
        if (sockets.empty() || !isProcess(name) || !isDaemon(process)) {
            continue;
        }
        const Holds holds = holdsOneOf(process, sockets);
        isDoubtful = isDoubtful || holds == Holds::unknown;
        if (holds == Holds::yes) {
            state.pid = std::stoll(name);
            state.lastStart = startOf(process);
            state.whyNoStart = "the process has ended meanwhile";
            return state;
        }
    }
    if (isDoubtful) {
        state.problem =
            failure(ExitStatus::unreadable, "a daemon of another user runs, which may be this one");
    }
    state.whyNoStart = "no daemon runs, and nobody keeps when one did";
    return state;
}

} // namespace kstctl
