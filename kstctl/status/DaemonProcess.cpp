#include "kstctl/status/DaemonProcess.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/Report.h"
#include "kstctl/status/DaemonSockets.h"
#include "kstctl/status/Section.h"
#include "platform/linux/LinuxClock.h"

#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <sstream>
#include <string_view>
#include <system_error>
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
        // By name first: the descriptors of most processes are closed to the caller, and each of
        // those would make the answer doubtful.
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

namespace {

constexpr char kInitSystem[] = "org.freedesktop.systemd1";
constexpr char kUnitPath[] = "/org/freedesktop/systemd1/unit/kstd_2eservice";
constexpr char kUnitInterface[] = "org.freedesktop.systemd1.Unit";
constexpr char kServiceInterface[] = "org.freedesktop.systemd1.Service";
constexpr std::int64_t kNanosecondsPerMicrosecond = 1000;

struct Closer {
    void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};

DaemonState unknownBecause(int error) {
    DaemonState state{.source = "init system"};
    state.problem = failure(
        isRefusal(error) ? ExitStatus::unreadable : ExitStatus::failed,
        base::concat("the init system cannot be asked: ", std::generic_category().message(error)));
    return state;
}

/// Asks for properties until one of them cannot be had.
class Unit {
  public:
    explicit Unit(sd_bus* bus) : bus_(bus) {}

    std::string text(const char* interface, const char* property) {
        char* value = nullptr;
        note(sd_bus_get_property_string(bus_, kInitSystem, kUnitPath, interface, property, nullptr,
                                        &value));
        const std::unique_ptr<char, decltype(&std::free)> owner(value, std::free);
        return value != nullptr ? value : std::string();
    }

    template <typename Number>
    Number number(char type, const char* property) {
        Number value = 0;
        note(sd_bus_get_property_trivial(bus_, kInitSystem, kUnitPath, kServiceInterface, property,
                                         nullptr, type, &value));
        return value;
    }

    [[nodiscard]] int error() const { return error_; }

  private:
    void note(int result) {
        if (result < 0 && error_ == 0) {
            error_ = -result;
        }
    }

    sd_bus* bus_;
    int error_ = 0;
};

} // namespace

bool isInitSystemThere() {
    return sd_booted() > 0;
}

DaemonState askInitSystem() {
    sd_bus* opened = nullptr;
    const int result = sd_bus_open_system(&opened);
    const std::unique_ptr<sd_bus, Closer> bus(opened);
    return result < 0 ? unknownBecause(-result) : askInitSystem(bus.get());
}

DaemonState askInitSystem(sd_bus* bus) {
    Unit unit(bus);
    const std::string load = unit.text(kUnitInterface, "LoadState");
    const auto started = unit.number<std::uint64_t>('t', "ExecMainStartTimestamp");
    const auto pid = unit.number<std::uint32_t>('u', "MainPID");
    if (unit.error() != 0) {
        return unknownBecause(unit.error());
    }
    DaemonState state{.source = "init system"};
    // The init system answers for units that it does not have, too.
    if (load == "not-found") {
        state.problem = failure(ExitStatus::missing, "there is no unit kstd.service");
        return state;
    }
    if (pid != 0) {
        state.pid = pid;
    }
    if (started != 0) {
        state.lastStart =
            platform::Date{static_cast<std::int64_t>(started) * kNanosecondsPerMicrosecond};
    } else {
        state.whyNoStart = "not since the machine has started";
    }
    return state;
}

namespace {

void addSocket(Section& section, const EventSocketFile& socket) {
    Report report;
    report.add("path", socket.path).add("isPresent", socket.isPresent);
    if (socket.isPresent) {
        report.add("owner", socket.owner).add("mode", octalMode(socket.mode));
    }
    if (!socket.problem) {
        report.add("isOpen", true);
    } else if (statusOf(*socket.problem) == ExitStatus::missing) {
        report.add("isOpen", false, socket.problem->description);
    } else {
        report.add("isOpen", Report::Unknown{socket.problem->description});
    }
    if (socket.problem) {
        section.note(*socket.problem);
    }
    section.report.add("eventSocket", std::move(report));
}

void addProcess(Section& section, const DaemonState& state) {
    if (state.problem) {
        section.addUnknown("isRunning", *state.problem);
        section.report.add("lastStart", Report::Unknown{state.problem->description});
        return;
    }
    section.report.add("isRunning", state.pid.has_value());
    if (state.pid) {
        section.report.add("pid", *state.pid);
    }
    if (state.lastStart) {
        section.report.add("lastStart", timeText(*state.lastStart));
    } else {
        section.report.add("lastStart", Report::Unknown{state.whyNoStart});
    }
    section.report.add("source", state.source);
}

} // namespace

Section daemonSection(const Environment& environment) {
    Section section;
    const EventSocketFile socket = EventSocketFile::look(environment.paths);
    addSocket(section, socket);
    addProcess(section, environment.paths.isSystemRoot() && isInitSystemThere()
                            ? askInitSystem()
                            : findDaemonProcess(socket.path));
    return section;
}

} // namespace kstctl
