#include "platform/linux/LinuxHost.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"
#include "platform/formats/JSONCodec.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/host/SerialQueueOfOne.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/IdleExit.h"
#include "platform/linux/LinuxClock.h"
#include "platform/linux/LinuxConfiguration.h"
#include "platform/linux/LinuxEventStream.h"
#include "platform/linux/LinuxFiles.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxManagedSettings.h"
#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "platform/linux/LinuxSystemLog.h"
#include "platform/linux/LinuxSystemVersion.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "platform/linux/SettingsWatch.h"
#include "platform/linux/alarms/HelpedAlarmWaker.h"
#include "platform/linux/alarms/LinuxAlarm.h"
#include "platform/linux/alarms/TimerAlarmWaker.h"

#include <systemd/sd-daemon.h>

#include <cstdlib>
#include <exception>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

namespace platform {

namespace {

/// The daemon's lines bear its name whatever program it runs in.
constexpr std::string_view kIdentifier = "kstd";

RemoteHTTPOptions httpsOptions(const LinuxHostOptions& options) {
    RemoteHTTPOptions https = options.https;
    if (https.socket.empty()) {
        https.socket = options.paths.httpsSocket();
    }
    https.stop = options.stop;
    return https;
}

} // namespace

/// In the order of construction: what stands below uses what stands above, and goes before it.
struct LinuxHost::Parts {
    explicit Parts(LinuxHostOptions options)
        : systemLog(options.paths, kIdentifier),
          log(options.log != nullptr ? *options.log : systemLog),
          files(options.paths, log),
          settings(options.paths, log),
          defaults(options.paths, propertyLists, log),
          resources(options.paths, propertyLists, log),
          version(options.paths),
          diagnostics(options.paths),
          https(httpsOptions(options)),
          registry(options.paths.kernelSocket(), log),
          channel(options.paths.kernelSocket(), registry, log),
          runLoop(log),
          events(runLoop, log),
          timerWaker(runLoop, [this] { alarm.woke(); }),
          waker(options.paths.alarmHelperSocket(), runLoop, timerWaker, log),
          alarm(events, AlarmStore(options.paths.alarmDirectory(), std::move(options.alarms), log),
                waker) {
        settingsWatch.emplace(options.paths.managedSettings(), runLoop, log, [this] {
            post(wire::kNotifydMatchingStream, kSettingsChangedEvent);
        });
        if (options.eventSocket.isOpen()) {
            eventSocket = std::make_unique<EventSocket>(
                std::move(options.eventSocket), runLoop, log,
                [this](const wire::EventDatagram& event) { arrived(event); });
        } else {
            log.write(LogLevel::warning,
                      "kstd: EventSocket: no socket was handed over; no events will arrive.\n",
                      {.messageId = message::kNoEventSocket});
        }
        if (options.stop != nullptr && options.stop->descriptor() >= 0) {
            stop = runLoop.addUrgent(options.stop->descriptor(), [this] { closeStreams(); });
        } else if (options.stop != nullptr) {
            log.write(LogLevel::warning,
                      base::concat("kstd: StopRequest: SIGTERM ends the daemon wherever it is: ",
                                   std::generic_category().message(options.stop->failure()), ".\n"),
                      {});
        }
        if (options.idleTime) {
            idleExit = std::make_unique<IdleExit>(
                runLoop, *options.idleTime, [this] { return isBusyAfterIdleTime(); },
                [this] { closeStreams(); });
            events.addDeliveryObserver([this](const Event&) { idleExit->touch(); });
        }
    }

    bool isBusyAfterIdleTime() {
        alarm.tryAgain();
        return events.busy() || transactions.busy() || alarm.holdsProcess();
    }

    void post(std::string_view stream, std::string_view name) {
        events.post({std::string(stream), std::string(name)});
    }

    void arrived(const wire::EventDatagram& event) {
        if (event.stream != wire::kAlarmStream) {
            post(event.stream, event.name);
        } else if (!alarm.arrived(event.stream, event.name, event.payload)) {
            log.write(
                LogLevel::warning,
                base::concat("kstd: EventSocket: dropped alarm ", event.name, " without a date.\n"),
                {.messageId = message::kMalformedEvent});
        }
    }

    void closeStreams() {
        if (std::exchange(closed, true)) {
            return;
        }
        // The request stays readable for good, and would be served before what is still queued.
        stop.reset();
        sd_notify(0, "STOPPING=1");
        eventSocket.reset();
        settingsWatch.reset();
        alarm.close();
    }

    LinuxSystemLog systemLog;
    SystemLog& log;
    LinuxFiles files;
    LinuxManagedSettings settings;
    LinuxClock clock;
    PropertyListCodec propertyLists;
    LinuxUserDefaults defaults;
    LinuxConfigurationResource resources;
    LinuxSystemVersion version;
    LinuxInternalDiagnostics diagnostics;
    JSONCodec json;
    SerialQueuesOfOne queues;
    RemoteHTTPSessions https;
    LinuxServiceRegistry registry;
    LinuxKernelChannel channel;
    LinuxProcessTransactions transactions;
    LinuxRunLoop runLoop;
    LinuxEventStream events;
    TimerAlarmWaker timerWaker;
    HelpedAlarmWaker waker;
    LinuxAlarm alarm;
    std::optional<SettingsWatch> settingsWatch;
    std::unique_ptr<EventSocket> eventSocket;
    std::unique_ptr<RunLoopSource> stop;
    bool closed = false;
    std::unique_ptr<IdleExit> idleExit;
};

LinuxHost::LinuxHost(LinuxHostOptions options) {
    LinuxSystemLog systemLog(options.paths, kIdentifier);
    SystemLog& log = options.log != nullptr ? *options.log : systemLog;
    try {
        parts_ = std::make_unique<Parts>(std::move(options));
    } catch (const std::exception& error) {
        log.write(LogLevel::error, base::concat("kstd: cannot start: ", error.what(), ".\n"),
                  {.messageId = message::kCannotStart});
        throw;
    }
}

LinuxHost::~LinuxHost() {
    parts_->events.clearHandlers();
}

int LinuxHost::run(const std::function<int(const Host&)>& program) {
    int status = EXIT_FAILURE;
    try {
        status = program(interfaces());
        if (!parts_->runLoop.hasFailed()) {
            return status;
        }
    } catch (const std::exception& error) {
        parts_->log.write(LogLevel::error,
                          base::concat("kstd: cannot go on: ", error.what(), ".\n"), {});
    }
    closeStreams();
    return EXIT_FAILURE;
}

void LinuxHost::closeStreams() {
    parts_->closeStreams();
}

Host LinuxHost::interfaces() {
    return {.log = parts_->log,
            .registry = parts_->registry,
            .channel = parts_->channel,
            .events = parts_->events,
            .alarms = parts_->alarm,
            .transactions = parts_->transactions,
            .runLoop = parts_->runLoop,
            .settings = parts_->settings,
            .files = parts_->files,
            .clock = parts_->clock,
            .propertyLists = parts_->propertyLists,
            .json = parts_->json,
            .defaults = parts_->defaults,
            .resources = parts_->resources,
            .version = parts_->version,
            .diagnostics = parts_->diagnostics,
            .queues = parts_->queues,
            .https = parts_->https};
}

} // namespace platform
