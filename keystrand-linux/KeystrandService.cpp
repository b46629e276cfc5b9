#include "keystrand-linux/KeystrandService.h"

#include "base/Concat.h"
#include "wire/SystemPaths.h"

#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>
#include <vector>

namespace keystrand::usb {

namespace {

using wire::underRoot;

constexpr char kPolicies[] = "/etc/keystrand/policies";
constexpr char kRecord[] = "/run/keystrand/gate";
constexpr char kDevices[] = "/var/lib/keystrand/devices";
constexpr char kLastUsers[] = "/var/lib/keystrand/last-user";
constexpr char kSleepAgain[] = "/run/keystrand/sleep-again";
constexpr char kPlayedEvents[] = "/run/keystrand/kernel-events.sock";

bool isTheMachine(const std::string& root) {
    return underRoot(root, "/") == "/";
}

StateFile recordUnder(const std::string& root) {
    return {underRoot(root, kRecord), StateFile::Durability::none};
}

/// The kernel tells of the machine's own devices alone: under any other root somebody plays it.
SysfsUsbBus::System systemUnder(const std::string& root) {
    SysfsUsbBus::System system;
    if (!isTheMachine(root)) {
        system.openEvents = [path = underRoot(root, kPlayedEvents)](std::string& problem) {
            return openEventsAt(path, problem);
        };
    }
    return system;
}

/// Under any other root than the machine's nobody sits.
MachineSwitches::ActiveUsers activeUsersUnder(const std::string& root) {
    if (isTheMachine(root)) {
        return usersAtTheSeats;
    }
    return [] {
        return std::vector<uid_t>();
    };
}

/// The user whose word about sessions counts. Under any other root than the machine's it is the
/// user who started this.
uid_t userOfSessions(const std::string& root, GateLog& log) {
    if (!isTheMachine(root)) {
        return ::geteuid();
    }
    const auto user = SessionsSocket::userOfSessions();
    if (!user) {
        log.write(GateLine::listenerAway,
                  "keystrand: there is no user keystrand-sessions; only root is heard");
    }
    return user.value_or(0);
}

/// What is asked of the init system by making a file that it waits for.
void askForSleep(const std::string& path, GateLog& log) {
    const base::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!file.isOpen()) {
        log.write(GateLine::recordFailed, base::concat("keystrand: ", path, ": cannot be written: ",
                                                       std::generic_category().message(errno)));
    }
}

void makeStateDirectory(const std::string& root) {
    // What cannot be made is told when something is to be written there.
    for (const char* directory : {"/var", "/var/lib", "/var/lib/keystrand"}) {
        static_cast<void>(::mkdir(underRoot(root, directory).c_str(), 0755));
    }
}

} // namespace

std::unique_ptr<KeystrandService> KeystrandService::create(const std::string& root,
                                                           base::FileDescriptor activated,
                                                           GateLog& log, std::string& error) {
    KernelState kernel;
    const std::string policies = underRoot(root, kPolicies);
    bool hasPolicies = ::access(policies.c_str(), F_OK) == 0;
    if (const auto problem = hasPolicies ? kernel.policies.load(policies) : std::nullopt) {
        // The ports are guarded all the same.
        hasPolicies = false;
        log.write(
            GateLine::configuration,
            base::concat("keystrand: ", *problem, "; contexts and credentials are not served"));
    }
    auto loop = EventLoop::create();
    if (!loop) {
        error = "cannot make an event loop";
        return nullptr;
    }
    auto service = openServiceSocket(root, std::move(activated), error);
    if (!service) {
        return nullptr;
    }
    auto gate = ListeningSocket::open(underRoot(root, wire::kGateSocket), SOCK_SEQPACKET, error);
    if (!gate) {
        return nullptr;
    }
    auto timers = std::make_unique<LoopTimers>(*loop);
    auto sessions = SessionsSocket::open(
        *loop, *timers, underRoot(root, wire::kSessionsSocket), userOfSessions(root, log),
        [&log](const std::string& line) { log.write(GateLine::listenerAway, line); }, error);
    if (!sessions) {
        return nullptr;
    }
    makeStateDirectory(root);
    std::unique_ptr<KeystrandService> made(new KeystrandService(root, log, std::move(loop),
                                                                std::move(kernel), hasPolicies,
                                                                {.service = std::move(*service),
                                                                 .gate = std::move(*gate),
                                                                 .timers = std::move(timers),
                                                                 .sessions = std::move(sessions)}));
    if (!made->deadline_ || !made->terminate_ || !made->interrupt_) {
        error = "cannot watch for signals and time";
        return nullptr;
    }
    made->keystrand_.start();
    return made;
}

KeystrandService::KeystrandService(const std::string& root, GateLog& log,
                                   std::unique_ptr<EventLoop> loop, KernelState kernel,
                                   bool hasPolicies, Sockets sockets)
    : log_(log),
      loop_(std::move(loop)),
      timers_(std::move(sockets.timers)),
      sessions_(std::move(sockets.sessions)),
      kernel_(std::move(kernel)),
      events_(*loop_, underRoot(root, wire::kEventSocket)),
      bus_(*loop_, root, log, systemUnder(root)),
      record_(recordUnder(root)),
      devices_(underRoot(root, kDevices), StateFile::Durability::synced),
      lastUsers_(underRoot(root, kLastUsers), StateFile::Durability::synced),
      switches_(root, lastUsers_, log, activeUsersUnder(root)),
      keystrand_(
          {.kernel = kernel_,
           .events = events_,
           .clock = clocks_,
           .lockState = *sessions_,
           .bus = bus_,
           .record = record_,
           .devices = devices_,
           .log = log,
           .switches = [this] { return switches_.read(); },
           .sleepAgain = [&log, path = underRoot(root, kSleepAgain)] { askForSleep(path, log); },
           .rearm =
               [this] {
                   arm();
               }},
          [&] {
              GateConfiguration configuration = readGateConfiguration(root);
              for (const std::string& remark : configuration.remarks) {
                  log.write(GateLine::configuration, remark);
              }
              return configuration.settings;
          }()),
      commands_(hasPolicies ? makeCommands(
                                  kernel_,
                                  [this] {
                                      return static_cast<CredentialSet::Seconds>(
                                          clocks_.wall() / std::chrono::seconds(1));
                                  },
                                  keystrand_.kernelControls())
                            : makeServiceCommands(kernel_, keystrand_.kernelControls())),
      handler_({.registry = kernel_.registry, .commands = commands_, .logLevel = kernel_.logLevel}),
      server_(*loop_, std::move(sockets.service), handler_),
      gateSocket_(*loop_, std::move(sockets.gate), keystrand_, clocks_),
      deadline_(loop_->timer(CLOCK_BOOTTIME, [this] { keystrand_.wake(); })),
      dateWatch_(*loop_, [this] { keystrand_.clockWasSet(); }),
      terminate_(loop_->signal(SIGTERM, [this] { stop(); })),
      interrupt_(loop_->signal(SIGINT, [this] { stop(); })) {
    watchWork(*loop_);
}

void KeystrandService::watchWork(EventLoop& loop) {
    std::uint64_t microseconds = 0;
    if (sd_watchdog_enabled(0, &microseconds) <= 0) {
        return;
    }
    loop.setTurns({.work = [start = base::concat(
                                "WATCHDOG=1\nWATCHDOG_USEC=",
                                std::to_string(microseconds))] { sd_notify(0, start.c_str()); },
                   .rest =
                       [stop = base::concat("WATCHDOG_USEC=", std::to_string(UINT64_MAX))] {
                           sd_notify(0, stop.c_str());
                       }});
}

bool KeystrandService::run() {
    return loop_->run();
}

void KeystrandService::stop() {
    if (keystrand_.gate().closed()) {
        log_.write(GateLine::closed,
                   "keystrand: stopped; the gate stays closed. keystrand --restore opens it");
    }
    loop_->stop();
}

void KeystrandService::arm() {
    // Called while the parts are made, too.
    if (!deadline_) {
        return;
    }
    const BootTime next = keystrand_.nextWake();
    if (next == BootTime::max()) {
        deadline_.disable();
    } else {
        deadline_.expireAt(static_cast<std::uint64_t>(std::max<BootTime::rep>(next.count(), 1)));
    }
}

bool KeystrandService::restore(const std::string& root, Restored what, const MachineClock& clock,
                               GateLog& log) {
    const auto loop = EventLoop::create();
    if (!loop) {
        log.write(GateLine::writeFailed, "keystrand: cannot make an event loop");
        return false;
    }
    SysfsUsbBus bus(*loop, root, log, systemUnder(root));
    const StateFile record = recordUnder(root);
    const StateFile devices(underRoot(root, kDevices), StateFile::Durability::synced);
    GateRules rules = readGateConfiguration(root).settings.rules;
    if (what == Restored::all) {
        rules.onUnlock = OnUnlock::accept;
    }
    UsbGate gate({.bus = bus,
                  .record = record,
                  .devices = devices,
                  .log = log,
                  .now = [&] { return clock.sinceStart(); },
                  .rearm =
                      [] {
                      }},
                 rules);
    const auto left = gate.resume();
    bool isOpen = true;
    if (what == Restored::all) {
        gate.takeOver();
    }
    const bool isLeft = what == Restored::all || (left && left->gate != GateState());
    if (isLeft) {
        isOpen = gate.restore([&](BootTime until) { loop->turn(until - clock.sinceStart()); });
    }
    if (const std::string lost = gate.closedByNobodyKnows(); !lost.empty()) {
        log.write(GateLine::writeFailed, base::concat("keystrand: cannot open ", lost,
                                                      ": who closed it is not known any more"));
        isOpen = false;
    } else if (!isLeft) {
        log.write(GateLine::opened, "keystrand: there is nothing to be put back");
    }
    std::string problem;
    if (isOpen && !record.remove(problem)) {
        log.write(GateLine::recordFailed, base::concat("keystrand: ", problem));
    }
    return isOpen && problem.empty();
}

} // namespace keystrand::usb
