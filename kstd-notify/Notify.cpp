#include "kstd-notify/Notify.h"

#include "kstd-notify/EventSender.h"
#include "kstd-notify/Notice.h"
#include "platform/SystemLog.h"
#include "platform/shared/LogText.h"

#include <ostream>

namespace notify {

namespace {

constexpr char kUsage[] = "usage: kstd-notify alarm|settings\n"
                          "  alarm     tell the daemon of every registered alarm\n"
                          "  settings  tell the daemon that the managed settings have changed\n";

/// The log of a program whose standard error is in the journal.
class StreamLog final : public platform::SystemLog {
  public:
    explicit StreamLog(std::ostream& stream) : stream_(stream) {}

    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::CodePlace& /*place*/) override {
        stream_ << platform::logLine(text) << '\n';
    }

  private:
    std::ostream& stream_;
};

} // namespace

ExitStatus run(std::span<const std::string_view> arguments, const platform::Paths& paths,
               platform::Clock& clock, std::chrono::milliseconds patience, std::ostream& errors) {
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
