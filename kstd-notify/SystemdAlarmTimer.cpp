#include "kstd-notify/SystemdAlarmTimer.h"

#include "base/Concat.h"
#include "base/NotCopied.h"

#include <systemd/sd-bus.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <functional>
#include <limits>
#include <optional>
#include <string>
#include <system_error>
#include <time.h>

namespace notify {

namespace {

/// A connection to systemd's manager over the system's message bus, for a few calls in a row.
///
/// Every call waits for its answer, and a job for its end, as long as its patience.
class SystemdBus : private base::NotCopied {
  public:
    using Patience = std::chrono::microseconds;

    /// `socket` is the file of the bus's socket. That nobody serves it shows in the calls.
    SystemdBus(const std::string& socket, Patience patience);
    ~SystemdBus();

    [[nodiscard]] platform::Result<std::uint64_t>
    unsignedProperty(const char* path, const char* interface, const char* name);

    /// Adds the arguments of a call to its message; negative when that failed.
    using Arguments = std::function<int(sd_bus_message* call)>;

    /// Calls a method of the manager that begins a job, and waits until the job has ended, however
    /// it did.
    [[nodiscard]] std::optional<platform::Error> runJob(const char* method,
                                                        const Arguments& arguments);

    /// The name of the bus's error for a unit that is not there.
    static constexpr char kNoSuchUnit[] = "org.freedesktop.systemd1.NoSuchUnit";

  private:
    [[nodiscard]] std::optional<platform::Error> awaitRemoval(const std::string& job);

    sd_bus* bus_ = nullptr;
    Patience patience_;
    /// Why there is no connection; 0 when there is one.
    int failure_ = 0;
    /// The job whose end was told last.
    std::string removedJob_;
};

constexpr char kSystemd[] = "org.freedesktop.systemd1";
constexpr char kManagerPath[] = "/org/freedesktop/systemd1";
constexpr char kManager[] = "org.freedesktop.systemd1.Manager";

/// As the bus's library takes it.
std::uint64_t microseconds(SystemdBus::Patience time) {
    return static_cast<std::uint64_t>(std::max<SystemdBus::Patience::rep>(time.count(), 0));
}

int connect(sd_bus** bus, const std::string& socket, SystemdBus::Patience patience) {
    int result = sd_bus_new(bus);
    const auto then = [&result](int next) {
        result = next;
        return result >= 0;
    };
    if (result >= 0 && then(sd_bus_set_address(*bus, base::concat("unix:path=", socket).c_str())) &&
        then(sd_bus_set_bus_client(*bus, 1)) &&
        then(sd_bus_set_method_call_timeout(*bus, microseconds(patience)))) {
        then(sd_bus_start(*bus));
    }
    return result;
}

/// The error of a call: the bus's own words, or the system's where it has none.
platform::Error errorOf(int result, const sd_bus_error& error) {
    const std::string text =
        error.message != nullptr ? error.message : std::generic_category().message(-result);
    return {error.name != nullptr ? error.name : platform::kSystemErrorDomain, -result, text};
}

platform::Error systemError(int result) {
    return errorOf(result, sd_bus_error{});
}

int takeRemovedJob(sd_bus_message* signal, void* removedJob, sd_bus_error* /*error*/) {
    std::uint32_t id = 0;
    const char* path = nullptr;
    const char* unit = nullptr;
    const char* result = nullptr;
    if (sd_bus_message_read(signal, "uoss", &id, &path, &unit, &result) >= 0) {
        *static_cast<std::string*>(removedJob) = path;
    }
    return 0;
}

SystemdBus::SystemdBus(const std::string& socket, Patience patience) : patience_(patience) {
    const int result = connect(&bus_, socket, patience);
    failure_ = result < 0 ? result : 0;
}

SystemdBus::~SystemdBus() {
    sd_bus_close_unref(bus_);
}

platform::Result<std::uint64_t>
SystemdBus::unsignedProperty(const char* path, const char* interface, const char* name) {
    if (failure_ != 0) {
        return systemError(failure_);
    }
    std::uint64_t value = 0;
    sd_bus_error error{};
    const int result = sd_bus_get_property_trivial(bus_, kSystemd, path, interface, name, &error,
                                                   SD_BUS_TYPE_UINT64, &value);
    if (result < 0) {
        const platform::Error failed = errorOf(result, error);
        sd_bus_error_free(&error);
        return failed;
    }
    return value;
}

std::optional<platform::Error> SystemdBus::runJob(const char* method, const Arguments& arguments) {
    if (failure_ != 0) {
        return systemError(failure_);
    }
    sd_bus_message* call = nullptr;
    sd_bus_message* reply = nullptr;
    sd_bus_error error{};
    const char* job = nullptr;
    // Only the jobs of this connection's calls are told to it.
    int result = sd_bus_match_signal(bus_, nullptr, kSystemd, kManagerPath, kManager, "JobRemoved",
                                     takeRemovedJob, &removedJob_);
    const auto then = [&result](int next) {
        result = next;
        return result >= 0;
    };
    const bool isBegun = result >= 0 &&
                         then(sd_bus_message_new_method_call(bus_, &call, kSystemd, kManagerPath,
                                                             kManager, method)) &&
                         then(arguments(call)) &&
                         then(sd_bus_call(bus_, call, microseconds(patience_), &error, &reply)) &&
                         then(sd_bus_message_read(reply, "o", &job));
    std::optional<platform::Error> failed = isBegun ? awaitRemoval(job) : errorOf(result, error);
    sd_bus_error_free(&error);
    sd_bus_message_unref(reply);
    sd_bus_message_unref(call);
    return failed;
}

std::optional<platform::Error> SystemdBus::awaitRemoval(const std::string& job) {
    const auto deadline = std::chrono::steady_clock::now() + patience_;
    while (removedJob_ != job) {
        const int processed = sd_bus_process(bus_, nullptr);
        if (processed < 0) {
            return systemError(processed);
        }
        // Also after a message that was processed: there may always be another one.
        const auto left =
            std::chrono::duration_cast<Patience>(deadline - std::chrono::steady_clock::now());
        if (left.count() <= 0) {
            return systemError(-ETIMEDOUT);
        }
        const int waited = processed > 0 ? 0 : sd_bus_wait(bus_, microseconds(left));
        if (waited < 0 && waited != -EINTR) {
            return systemError(waited);
        }
    }
    return std::nullopt;
}

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
    const auto next = SystemdBus(busSocket_, patience_)
                          .unsignedProperty(kUnitPath, kTimer, "NextElapseUSecRealtime");
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
    return SystemdBus(busSocket_, patience_)
        .runJob("StartTransientUnit",
                [&](sd_bus_message* call) { return appendUnit(call, time, wakes); });
}

std::optional<platform::Error> SystemdAlarmTimer::elapseNow() {
    return SystemdBus(busSocket_, patience_).runJob("StartUnit", [](sd_bus_message* call) {
        return sd_bus_message_append(call, "ss", kService, kReplace);
    });
}

std::optional<platform::Error> SystemdAlarmTimer::stop() {
    auto error = SystemdBus(busSocket_, patience_).runJob("StopUnit", [](sd_bus_message* call) {
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
