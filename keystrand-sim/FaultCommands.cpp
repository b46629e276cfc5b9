#include "keystrand-sim/ControlCommand.h"
#include "wire/KernelSocket.h"

#include <array>

namespace keystrand::sim {

namespace {

constexpr std::uint32_t kMaxReplySize =
    static_cast<std::uint32_t>(wire::kKernelMessageMaxSize - wire::kKernelReplyHeaderSize);
constexpr std::uint32_t kMaxGarbageSize = wire::kKernelMessageMaxSize;
constexpr std::uint32_t kMaxDelayMilliseconds = 600'000;

struct NamedOperation {
    std::string_view name;
    wire::KernelOperation operation;
};

constexpr std::array kOperations = {
    NamedOperation{"find-path", wire::KernelOperation::findByPath},
    NamedOperation{"find-class", wire::KernelOperation::findByClassName},
    NamedOperation{"property", wire::KernelOperation::copyProperty},
    NamedOperation{"open", wire::KernelOperation::open},
    NamedOperation{"struct", wire::KernelOperation::structCall},
    NamedOperation{"scalar", wire::KernelOperation::scalarCall},
};

std::uint64_t takeTimes(ControlArguments& arguments) {
    const auto text = arguments.named("times");
    if (!text) {
        return 1;
    }
    if (*text == "always") {
        return FaultScript::kAlways;
    }
    const auto times = base::parseNumber<std::uint64_t>(*text);
    if (!times || *times == 0) {
        arguments.fail("times", "bad number");
        return 1;
    }
    return *times;
}

std::optional<wire::KernelOperation> takeOperation(ControlArguments& arguments) {
    const auto name = arguments.named("operation");
    if (!name) {
        return std::nullopt;
    }
    for (const NamedOperation& known : kOperations) {
        if (known.name == *name) {
            return known.operation;
        }
    }
    arguments.fail("operation", "unknown");
    return std::nullopt;
}

FaultMatch takeMatch(ControlArguments& arguments) {
    return {.operation = takeOperation(arguments),
            .command = arguments.namedNumber<std::uint8_t>("command"),
            .control = arguments.namedNumber<std::uint32_t>("control")};
}

FaultEffect takeEffect(ControlArguments& arguments) {
    FaultEffect effect;
    effect.status = arguments.namedNumber<std::int32_t>("status");
    effect.replySize = arguments.namedNumber<std::uint32_t>("reply", 0, kMaxReplySize);
    effect.garbageSize = arguments.namedNumber<std::uint32_t>("garbage", 1, kMaxGarbageSize);
    effect.reported = arguments.namedNumber<std::uint32_t>("reported");
    effect.delayMilliseconds =
        arguments.namedNumber<std::uint32_t>("delay", 1, kMaxDelayMilliseconds).value_or(0);
    effect.silence = arguments.flag("silence");
    effect.hangUp = arguments.flag("hang-up");
    effect.wrongSequence = arguments.flag("wrong-sequence");
    effect.perform = arguments.flag("perform");
    if (effect.isNothing()) {
        arguments.fail("effect", "missing");
    }
    return effect;
}

ControlOutcome faultRequest(ControlContext& context, ControlArguments& arguments) {
    const FaultMatch match = takeMatch(arguments);
    const FaultEffect effect = takeEffect(arguments);
    const std::uint64_t times = takeTimes(arguments);
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.faults.add(match, effect, times)) {
        return ControlOutcome::failed("too many faults");
    }
    return ControlOutcome::done();
}

ControlOutcome faultProperty(ControlContext& context, ControlArguments& arguments) {
    const std::string_view name = arguments.word("name");
    const std::uint64_t times = takeTimes(arguments);
    if (!arguments.flag("absent")) {
        arguments.fail("absent", "missing");
    }
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    if (!context.faults.hideProperty(name, times)) {
        return ControlOutcome::failed("too many faults");
    }
    return ControlOutcome::done();
}

ControlOutcome faultConnections(ControlContext& context, ControlArguments& arguments) {
    const std::uint64_t times = takeTimes(arguments);
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    context.faults.refuseConnections(times);
    return ControlOutcome::done();
}

template <bool present>
ControlOutcome faultEntry(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    context.faults.setEntryPresent(present);
    return ControlOutcome::done();
}

ControlOutcome faultClear(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    context.faults.clear();
    return ControlOutcome::done();
}

constexpr std::array kFaultCommands = {
    ControlCommand{"fault clear", "", faultClear},
    ControlCommand{"fault entry absent", "", faultEntry<false>},
    ControlCommand{"fault entry present", "", faultEntry<true>},
    ControlCommand{"fault property", "NAME absent [times=N|always]", faultProperty},
    ControlCommand{"fault refuse-connections", "[times=N|always]", faultConnections},
    ControlCommand{
        "fault",
        "[operation=NAME] [command=N] [control=N] status=N|reply=K|garbage=K|silence|hang-up|"
        "reported=K|wrong-sequence|delay=MS [perform] [times=N|always]",
        faultRequest},
};

} // namespace

std::span<const ControlCommand> faultCommands() {
    return kFaultCommands;
}

} // namespace keystrand::sim
