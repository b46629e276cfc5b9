#include "base/Concat.h"
#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/ControlCommand.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>

namespace keystrand::sim {

namespace {

ControlOutcome publish(ControlContext& context, const ControlArguments& arguments,
                       const Notification& notification) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.publisher.publish(notification)) {
        return ControlOutcome::failed("no room for the property or its event");
    }
    return ControlOutcome::done();
}

template <typename Number>
void override(ControlArguments& arguments, std::string_view name, Number& value) {
    value = arguments.namedNumber<Number>(name).value_or(value);
}

ControlOutcome publishTimerRestarted(ControlContext& context, ControlArguments& arguments) {
    TimerRestarted values = context.restrictedMode.timer().timerRestarted();
    override(arguments, "alarm", values.alarm);
    override(arguments, "version", values.state.version);
    override(arguments, "start", values.state.standardModeStart);
    override(arguments, "locked", values.state.lockedInRestrictedMode);
    return publish(context, arguments, makeTimerRestarted(values));
}

ControlOutcome publishAnalyticsCollected(ControlContext& context, ControlArguments& arguments) {
    AnalyticsCollected values =
        context.restrictedMode.timer().analyticsCollected(context.clock.now());
    override(arguments, "period", values.eventPeriodDuration);
    override(arguments, "restricted", values.restrictedModeDuration);
    override(arguments, "mode", values.restrictedMode);
    override(arguments, "passcode", values.policyDisabledByPasscodeNotSet);
    override(arguments, "boot-arg", values.policyDisabledByBootArg);
    override(arguments, "quorvane", values.policyDisabledByQuorvane);
    return publish(context, arguments, makeAnalyticsCollected(values));
}

ControlOutcome publishSaveAnalytics(ControlContext& context, ControlArguments& arguments) {
    AnalyticsBytes blob = encodeFigures(context.restrictedMode.timer().figures());
    if (arguments.hasWord()) {
        const auto bytes = arguments.bytes("blob");
        if (bytes.size() != blob.size()) {
            arguments.fail("blob", "not 32 bytes");
        } else {
            std::copy(bytes.begin(), bytes.end(), blob.begin());
        }
    }
    return publish(context, arguments, makeSaveAnalytics(blob));
}

ControlOutcome publishTimerRestartedAnalytics(ControlContext& context,
                                              ControlArguments& arguments) {
    std::uint32_t total = context.restrictedMode.timer().totalRestricted(context.clock.now());
    override(arguments, "total", total);
    return publish(context, arguments, makeTimerRestartedAnalytics(total));
}

ControlOutcome post(ControlContext& context, ControlArguments& arguments) {
    const std::string_view name = arguments.word("name");
    const std::string_view stream =
        arguments.named("stream").value_or(wire::kNotifydMatchingStream);
    const auto count =
        arguments.namedNumber<std::size_t>("count", 1, EventSender::kMaxQueued).value_or(1);
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!wire::encodeEvent(stream, name)) {
        return ControlOutcome::failed("not the names of an event");
    }
    // All of them or none.
    if (count > EventSender::kMaxQueued - context.events.queued()) {
        return ControlOutcome::failed("no room for so many events");
    }
    const std::string_view prefix = wire::rm::kNotificationNamePrefix;
    for (std::size_t i = 0; i < count; ++i) {
        context.events.post(stream, name);
        if (name.starts_with(prefix)) {
            context.kernel.registry.announce(name.substr(prefix.size()));
        }
    }
    return ControlOutcome::done();
}

constexpr std::array kPublishCommands = {
    ControlCommand{"publish timer-restarted", "[alarm=N] [version=N] [start=N] [locked=N]",
                   publishTimerRestarted},
    ControlCommand{"publish analytics-collected",
                   "[period=N] [restricted=N] [mode=N] [passcode=N] [boot-arg=N] [quorvane=N]",
                   publishAnalyticsCollected},
    ControlCommand{"publish save-analytics", "[HEX]", publishSaveAnalytics},
    ControlCommand{"publish timer-restarted-analytics", "[total=N]",
                   publishTimerRestartedAnalytics},
    ControlCommand{"post", "NAME [stream=STREAM] [count=N]", post},
};

} // namespace

std::span<const ControlCommand> publishCommands() {
    return kPublishCommands;
}

namespace {

ControlOutcome answer(std::string line) {
    ControlOutcome outcome;
    outcome.lines.push_back(std::move(line));
    return outcome;
}

ControlOutcome propertySet(ControlContext& context, ControlArguments& arguments) {
    const std::string_view name = arguments.word("name");
    const auto value = arguments.bytes("value");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.kernel.registry.set(name, value)) {
        return ControlOutcome::failed("name or value too long, or too many properties");
    }
    return ControlOutcome::done();
}

ControlOutcome propertyGet(ControlContext& context, ControlArguments& arguments) {
    const std::string_view name = arguments.word("name");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    const Registry::Property* property = context.kernel.registry.find(name);
    if (property == nullptr) {
        return ControlOutcome::failed("absent");
    }
    ControlOutcome outcome = answer(base::concat("value ", toHexWord(property->value)));
    outcome.lines.push_back(base::concat("generation ", property->generation));
    outcome.lines.push_back(base::concat("handed-out ", property->handedOut));
    return outcome;
}

ControlOutcome propertyRemove(ControlContext& context, ControlArguments& arguments) {
    const std::string_view name = arguments.word("name");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.kernel.registry.remove(name)) {
        return ControlOutcome::failed("absent");
    }
    return ControlOutcome::done();
}

ControlOutcome environmentSet(ControlContext& context, ControlArguments& arguments) {
    const auto id = arguments.numberWord<std::uint32_t>("id");
    const auto value = arguments.bytes("value");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.kernel.environment.set(id, value)) {
        return ControlOutcome::failed("value too long or too many variables");
    }
    return ControlOutcome::done();
}

ControlOutcome environmentGet(ControlContext& context, ControlArguments& arguments) {
    const auto id = arguments.numberWord<std::uint32_t>("id");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    return answer(base::concat("value ", toHexWord(context.kernel.environment.get(id))));
}

ControlOutcome logLevel(ControlContext& context, ControlArguments& arguments) {
    const auto level = arguments.numberWord<std::uint8_t>("level");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    context.kernel.logLevel = level;
    return ControlOutcome::done();
}

constexpr std::array kKernelStateCommands = {
    ControlCommand{"property set", "NAME HEX|empty", propertySet},
    ControlCommand{"property get", "NAME", propertyGet},
    ControlCommand{"property remove", "NAME", propertyRemove},
    ControlCommand{"env set", "ID HEX|empty", environmentSet},
    ControlCommand{"env get", "ID", environmentGet},
    ControlCommand{"log-level", "N", logLevel},
};

} // namespace

std::span<const ControlCommand> kernelStateCommands() {
    return kKernelStateCommands;
}

} // namespace keystrand::sim
