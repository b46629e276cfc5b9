#include "base/Concat.h"
#include "keystrand-sim/ControlCommand.h"

#include <array>

namespace keystrand::sim {

namespace {

using base::concat;

/// Carries out `act` when the arguments were all taken and right.
template <typename Act>
ControlOutcome actUnlessProblem(const ControlArguments& arguments, Act act) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    act();
    return ControlOutcome::done();
}

ControlOutcome lock(ControlContext& context, ControlArguments& arguments) {
    return actUnlessProblem(arguments, [&] { context.restrictedMode.lock(); });
}

ControlOutcome unlock(ControlContext& context, ControlArguments& arguments) {
    return actUnlessProblem(arguments, [&] { context.restrictedMode.unlock(); });
}

ControlOutcome passcode(ControlContext& context, ControlArguments& arguments) {
    const bool isSet = arguments.onOrOff();
    return actUnlessProblem(arguments, [&] { context.restrictedMode.setPasscodeSet(isSet); });
}

ControlOutcome bootArg(ControlContext& context, ControlArguments& arguments) {
    const bool isSet = arguments.onOrOff();
    return actUnlessProblem(arguments, [&] { context.restrictedMode.setBootArg(isSet); });
}

ControlOutcome quiet(ControlContext& context, ControlArguments& arguments) {
    const bool isQuiet = arguments.onOrOff();
    return actUnlessProblem(arguments, [&] { context.restrictedMode.setQuiet(isQuiet); });
}

ControlOutcome clockReal(ControlContext& context, ControlArguments& arguments) {
    return actUnlessProblem(arguments, [&] {
        context.clock.setReal();
        context.restrictedMode.catchUp();
    });
}

void moveClock(ControlContext& context, ModelClock::Seconds time) {
    context.clock.set(time);
    context.restrictedMode.catchUp();
}

ControlOutcome clockSet(ControlContext& context, ControlArguments& arguments) {
    const auto time =
        arguments.numberWord<ModelClock::Seconds>("time", 1, RestrictedModeTimer::kLatestTime);
    return actUnlessProblem(arguments, [&] { moveClock(context, time); });
}

ControlOutcome clockAdvance(ControlContext& context, ControlArguments& arguments) {
    const ManualClock& clock = context.clock;
    if (!clock.isManual()) {
        return ControlOutcome::failed("the clock is the real one");
    }
    const auto seconds = arguments.numberWord<ModelClock::Seconds>(
        "seconds", 0, RestrictedModeTimer::kLatestTime - clock.now());
    return actUnlessProblem(arguments, [&] { moveClock(context, clock.now() + seconds); });
}

const char* onOff(bool value) {
    return value ? "on" : "off";
}

std::vector<std::string> timerStatus(const RestrictedModeController& controller,
                                     const ManualClock& clock) {
    const RestrictedModeTimer& timer = controller.timer();
    const ModelClock::Seconds now = clock.now();
    const TimerRestarted record = timer.timerRestarted();
    const AnalyticsCollected analytics = timer.analyticsCollected(now);
    return {concat("clock ", clock.isManual() ? "manual" : "real"),
            concat("now ", now),
            concat("locked ", onOff(timer.locked())),
            concat("restricted ", onOff(timer.restricted())),
            concat("allowed ", onOff(timer.policy().allowed)),
            concat("passcode ", onOff(timer.policy().passcodeSet)),
            concat("boot-arg ", onOff(timer.policy().bootArg)),
            concat("quiet ", onOff(controller.quiet())),
            concat("period ", timer.periods().untilRestricted),
            concat("analytics-period ", timer.periods().analytics),
            concat("alarm ", record.alarm),
            concat("version ", record.state.version),
            concat("start ", record.state.standardModeStart),
            concat("period-start ", timer.figures().periodStart),
            concat("period-restricted ", analytics.restrictedModeDuration),
            concat("total-restricted ", timer.totalRestricted(now)),
            concat("next-deadline ", timer.nextDeadline())};
}

ControlOutcome status(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    outcome.lines = timerStatus(context.restrictedMode, context.clock);
    for (std::string line :
         {concat("published ", context.publisher.publishedCount()),
          concat("events-queued ", context.events.queued()),
          concat("events-sent ", context.events.sent()),
          concat("events-refused ", context.events.refused()),
          concat("requests ", context.requests.count()),
          concat("acks ", context.requests.acknowledgements()),
          concat("connections ", context.server.connectionCount()),
          concat("properties ", context.kernel.registry.count()),
          concat("environment-variables ", context.kernel.environment.count()),
          concat("contexts ", context.kernel.contexts.all().size()),
          concat("global-credentials ", context.kernel.globalCredentials.members().size()),
          concat("policies ", context.kernel.policies.all().size()),
          concat("log-level ", context.kernel.logLevel),
          concat("faults ", context.faults.pending())}) {
        outcome.lines.push_back(std::move(line));
    }
    return outcome;
}

constexpr std::array kTimerCommands = {
    ControlCommand{"status", "", status},
    ControlCommand{"lock", "", lock},
    ControlCommand{"unlock", "", unlock},
    ControlCommand{"passcode", "on|off", passcode},
    ControlCommand{"boot-arg", "on|off", bootArg},
    ControlCommand{"quiet", "on|off", quiet},
    ControlCommand{"clock real", "", clockReal},
    ControlCommand{"clock set", "SECONDS", clockSet},
    ControlCommand{"clock advance", "SECONDS", clockAdvance},
};

} // namespace

std::span<const ControlCommand> timerCommands() {
    return kTimerCommands;
}

} // namespace keystrand::sim
