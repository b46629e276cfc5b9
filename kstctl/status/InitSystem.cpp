#include "kstctl/status/InitSystem.h"

#include "base/Concat.h"
#include "kstctl/FileError.h"

#include <systemd/sd-bus.h>
#include <systemd/sd-daemon.h>

#include <cstdlib>
#include <memory>
#include <string_view>
#include <system_error>

namespace kstctl {

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

} // namespace kstctl
