#include "keystrand-sim/Simulator.h"

#include "wire/SystemPaths.h"

#include <csignal>
#include <ctime>
#include <sys/socket.h>
#include <utility>

namespace keystrand::sim {

namespace {

constexpr std::uint64_t kMicrosecondsPerSecond = 1'000'000;

} // namespace

std::unique_ptr<Simulator> Simulator::create(const Settings& settings,
                                             base::FileDescriptor activated, std::string& error) {
    PolicyTable policies;
    if (!settings.policies.empty()) {
        if (const auto problem = policies.load(settings.policies)) {
            error = *problem;
            return nullptr;
        }
    }
    auto loop = EventLoop::create();
    if (!loop) {
        error = "cannot make an event loop";
        return nullptr;
    }
    auto service = openServiceSocket(settings.root, std::move(activated), error);
    if (!service) {
        return nullptr;
    }
    auto control = ListeningSocket::open(
        wire::underRoot(settings.root, wire::kSimulatorControlSocket), SOCK_STREAM, error);
    if (!control) {
        return nullptr;
    }
    std::unique_ptr<Simulator> simulator(new Simulator(
        settings, std::move(policies), std::move(loop), std::move(*service), std::move(*control)));
    if (!simulator->deadline_ || !simulator->terminate_ || !simulator->interrupt_) {
        error = "cannot watch for signals and time";
        return nullptr;
    }
    return simulator;
}

Simulator::Simulator(const Settings& settings, PolicyTable policies,
                     std::unique_ptr<EventLoop> loop, ListeningSocket service,
                     ListeningSocket control)
    : loop_(std::move(loop)),
      events_(*loop_, wire::underRoot(settings.root, wire::kEventSocket)),
      clock_(settings.clock),
      publisher_(kernel_.registry, events_),
      restrictedMode_(settings.periods, clock_, kernel_.registry, publisher_),
      kernelControls_(makeKernelControls(restrictedMode_)),
      commands_(makeCommands(
          kernel_, [this] { return clock_.now(); }, kernelControls_)),
      handler_({.registry = kernel_.registry, .commands = commands_, .logLevel = kernel_.logLevel},
               faults_, requests_),
      server_(*loop_, std::move(service), handler_, [this] { return !faults_.takeRefusal(); }),
      control_(*loop_, std::move(control),
               {.kernel = kernel_,
                .clock = clock_,
                .restrictedMode = restrictedMode_,
                .publisher = publisher_,
                .events = events_,
                .faults = faults_,
                .requests = requests_,
                .server = server_}),
      deadline_(loop_->timer(CLOCK_REALTIME, [this] { restrictedMode_.catchUp(); })),
      terminate_(loop_->signal(SIGTERM, [this] { loop_->stop(); })),
      interrupt_(loop_->signal(SIGINT, [this] { loop_->stop(); })) {
    kernel_.policies = std::move(policies);
    kernel_.logLevel = settings.logLevel;
    restrictedMode_.setQuiet(settings.quiet);
    RestrictedModeController::Hooks hooks;
    hooks.rearm = [this] {
        armDeadline();
    };
    restrictedMode_.setHooks(std::move(hooks));
}

bool Simulator::run() {
    return loop_->run();
}

void Simulator::armDeadline() {
    if (clock_.isManual()) {
        deadline_.disable();
        return;
    }
    // A deadline that the system's clock cannot express never comes.
    const std::uint64_t seconds = restrictedMode_.nextDeadline();
    if (seconds > RestrictedModeTimer::kLatestTime / kMicrosecondsPerSecond) {
        deadline_.disable();
        return;
    }
    deadline_.expireAt(seconds * kMicrosecondsPerSecond);
}

} // namespace keystrand::sim
