#include "kstd-notify/SystemdAlarmTimer.h"

#include "kstd-notify/SystemdBus.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstdio>
#include <limits>
#include <time.h>

namespace notify {

namespace {

constexpr char kUnit[] = "kstd-alarm.timer";
constexpr char kService[] = "kstd-alarm.service";
constexpr char kUnitPath[] = "/org/freedesktop/systemd1/unit/kstd_2dalarm_2etimer";
constexpr char kTimer[] = "org.freedesktop.systemd1.Timer";
/// What is queued for the unit gives way to the new job.
constexpr char kReplace[] = "replace";

constexpr std::uint64_t kNever = std::numeric_limits<std::uint64_t>::max();
constexpr std::int64_t kMicrosecondsPerSecond = 1'000'000;

/// What the timer is like. It is gone once it has elapsed, and also when it has failed: one that
/// stays would stand in the way of the next.
bool appendProperties(sd_bus_message* call, AlarmTimerUnit::Time time,
                      AlarmTimerUnit::Wakes wakes) {
    constexpr std::uint64_t kAccuracyMicroseconds = 1;
    const int no = 0;
    const int wakeSystem = wakes == AlarmTimerUnit::Wakes::machine ? 1 : 0;
    const std::string calendar = calendarText(time);
    const auto append = [call](const char* name, const char* type, auto... values) {
        return sd_bus_message_append(call, "(sv)", name, type, values...) >= 0;
    };
    return append("Description", "s", "Alarm of kstd") &&
           append("TimersCalendar", "a(ss)", 1, "OnCalendar", calendar.c_str()) &&
           append("AccuracyUSec", "t", kAccuracyMicroseconds) &&
           append("WakeSystem", "b", wakeSystem) && append("RemainAfterElapse", "b", no) &&
           append("CollectMode", "s", "inactive-or-failed");
}

int appendUnit(sd_bus_message* call, AlarmTimerUnit::Time time, AlarmTimerUnit::Wakes wakes) {
    const bool isAppended = sd_bus_message_append(call, "ss", kUnit, kReplace) >= 0 &&
                            sd_bus_message_open_container(call, 'a', "(sv)") >= 0 &&
                            appendProperties(call, time, wakes) &&
                            sd_bus_message_close_container(call) >= 0 &&
                            // No other units along with it.
                            sd_bus_message_append(call, "a(sa(sv))", 0) >= 0;
    return isAppended ? 0 : -ENOMEM;
}

} // namespace

platform::Result<std::optional<AlarmTimerUnit::Time>> SystemdAlarmTimer::elapses() {
    const auto next =
        SystemdBus(busSocket_).unsignedProperty(kUnitPath, kTimer, "NextElapseUSecRealtime");
    if (!next) {
        return next.error();
    }
    // 0 is a timer without a time, the largest number one that is not there.
    if (next.value() == 0 || next.value() == kNever) {
        return std::optional<Time>();
    }
    return std::optional(static_cast<Time>(next.value()));
}

std::optional<platform::Error> SystemdAlarmTimer::start(Time time, Wakes wakes) {
    return SystemdBus(busSocket_).runJob("StartTransientUnit", [&](sd_bus_message* call) {
        return appendUnit(call, time, wakes);
    });
}

std::optional<platform::Error> SystemdAlarmTimer::elapseNow() {
    return SystemdBus(busSocket_).runJob("StartUnit", [](sd_bus_message* call) {
        return sd_bus_message_append(call, "ss", kService, kReplace);
    });
}

std::optional<platform::Error> SystemdAlarmTimer::stop() {
    auto error = SystemdBus(busSocket_).runJob("StopUnit", [](sd_bus_message* call) {
        return sd_bus_message_append(call, "ss", kUnit, kReplace);
    });
    return error && error->domain == SystemdBus::kNoSuchUnit ? std::nullopt : error;
}

std::string calendarText(AlarmTimerUnit::Time time) {
    const time_t seconds = time / kMicrosecondsPerSecond;
    tm parts{};
    ::gmtime_r(&seconds, &parts);
    char text[64] = {};
    const std::size_t length = ::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &parts);
    const int microseconds = static_cast<int>(time % kMicrosecondsPerSecond);
    static_cast<void>(
        std::snprintf(text + length, sizeof text - length, ".%06d UTC", microseconds));
    return text;
}

} // namespace notify
