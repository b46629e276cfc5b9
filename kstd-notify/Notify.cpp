#include "kstd-notify/Notify.h"

#include "kstd-notify/AlarmHelper.h"
#include "kstd-notify/EventSender.h"
#include "kstd-notify/Notice.h"
#include "kstd-notify/SystemdAlarmTimer.h"
#include "platform/SystemLog.h"
#include "platform/host/LogText.h"
#include "wire/EventDatagram.h"

#include <ostream>

namespace notify {

namespace {

constexpr char kUsage[] = "usage: kstd-notify alarm|arm|settings\n"
                          "  alarm     tell the daemon of every registered alarm\n"
                          "  arm       make the timer of the earliest alarm\n"
                          "  settings  tell the daemon that the managed settings have changed\n";

/// The log of a program whose standard error is in the journal.
class StreamLog final : public platform::SystemLog {
  public:
    explicit StreamLog(std::ostream& stream) : stream_(stream) {}

    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        stream_ << platform::logLine(text) << '\n';
    }

  private:
    std::ostream& stream_;
};

/// What is wrong with the alarms on disk, the daemon says.
class SilentLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view /*text*/,
               const platform::LogFields& /*fields*/) override {}
};

ExitStatus arm(const platform::Paths& paths, platform::Clock& clock, std::ostream& errors) {
    SilentLog log;
    platform::AlarmStore store(paths.alarmDirectory(), {wire::kAlarmName}, log);
    SystemdAlarmTimer unit(paths.systemBus());
    AlarmTimer timer(unit, clock, AlarmTimer::machineHere());
    AlarmHelper helper(takeActivatedAlarmSocket(), store, unit, timer, clock, errors);
    return helper.run() ? kSent : kNotSent;
}

} // namespace

ExitStatus run(std::span<const std::string_view> arguments, const platform::Paths& paths,
               platform::Clock& clock, std::chrono::milliseconds patience, std::ostream& errors) {
    if (arguments.size() == 1 && arguments.front() == "arm") {
        return arm(paths, clock, errors);
    }
    StreamLog log(errors);
    const auto notices =
        arguments.size() == 1 ? noticesOf(arguments.front(), paths, clock, log) : std::nullopt;
    if (!notices) {
        errors << kUsage;
        return kWrongUsage;
    }
    EventSender sender(paths.eventSocket(), patience);
    ExitStatus status = kSent;
    for (const Notice& notice : *notices) {
        if (const std::string reason = sender.send(notice); !reason.empty()) {
            errors << "kstd-notify: cannot send " << platform::logLine(notice.name) << " to "
                   << paths.eventSocket() << ": " << reason << '\n';
            status = kNotSent;
        }
    }
    return status;
}

} // namespace notify
