#include "base/Concat.h"
#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/ControlCommand.h"
#include "wire/KernelSocket.h"

#include <algorithm>
#include <array>

namespace keystrand::sim {

namespace {

constexpr std::size_t kDefaultLimit = 10'000;
/// An answer ends after the line that passes this.
constexpr std::size_t kMaxAnswerSize = std::size_t{4} * 1024 * 1024;
constexpr std::uint32_t kMaxTimeoutMilliseconds = 3'600'000;

template <typename Number>
std::string numberOrNone(const std::optional<Number>& value) {
    return value ? base::concat(*value) : "none";
}

std::string describe(const LoggedRequest& request) {
    std::string line =
        base::concat("request ", request.index, " command ", numberOrNone(request.command));
    if (request.control) {
        line += base::concat(" control ", *request.control);
    }
    line += base::concat(" payload ", toHexWord(request.payload));
    if (request.credentialType) {
        line += base::concat(" credential ", *request.credentialType);
    }
    if (request.withheld > 0) {
        line += base::concat(" withheld ", request.withheld);
    }
    return base::concat(line, " status ", numberOrNone(request.status));
}

ControlOutcome listRequests(ControlContext& context, ControlArguments& arguments) {
    const auto from = arguments.namedNumber<std::uint64_t>("from").value_or(1);
    const auto limit = arguments.namedNumber<std::size_t>("limit", 1).value_or(kDefaultLimit);
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    const auto& entries = context.requests.entries();
    auto entry = std::lower_bound(
        entries.begin(), entries.end(), from,
        [](const LoggedRequest& request, std::uint64_t index) { return request.index < index; });
    ControlOutcome outcome;
    std::size_t size = 0;
    for (; entry != entries.end() && outcome.lines.size() < limit && size < kMaxAnswerSize;
         ++entry) {
        outcome.lines.push_back(describe(*entry));
        size += outcome.lines.back().size();
    }
    if (entry != entries.end()) {
        outcome.lines.push_back(base::concat("next ", entry->index));
    }
    return outcome;
}

ControlOutcome clearRequests(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    context.requests.clear();
    return ControlOutcome::done();
}

/// Exactly one of: requests=N, acks=N, control=CODE count=N.
WaitCondition takeCondition(ControlArguments& arguments) {
    using Count = WaitCondition::Count;
    WaitCondition condition;
    if (const auto control = arguments.namedNumber<std::uint32_t>("control")) {
        const auto total = arguments.namedNumber<std::uint64_t>("count");
        if (!total) {
            arguments.fail("count", "missing");
        }
        condition.count = Count::control;
        condition.control = *control;
        condition.total = total.value_or(0);
    } else if (const auto acks = arguments.namedNumber<std::uint64_t>("acks")) {
        condition.count = Count::acknowledgements;
        condition.total = *acks;
    } else if (const auto requests = arguments.namedNumber<std::uint64_t>("requests")) {
        condition.total = *requests;
    } else {
        arguments.fail("requests, acks or control", "missing");
    }
    return condition;
}

ControlOutcome wait(ControlContext& /*context*/, ControlArguments& arguments) {
    WaitCondition condition = takeCondition(arguments);
    if (const auto timeout =
            arguments.namedNumber<std::uint32_t>("timeout", 0, kMaxTimeoutMilliseconds)) {
        condition.timeout = std::chrono::milliseconds(*timeout);
    }
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    outcome.wait = condition;
    return outcome;
}

constexpr std::array kRequestCommands = {
    ControlCommand{"requests clear", "", clearRequests},
    ControlCommand{"requests", "[from=N] [limit=N]", listRequests},
    ControlCommand{"wait", "requests=N | acks=N | control=CODE count=N  [timeout=MS]", wait},
};

} // namespace

std::span<const ControlCommand> requestCommands() {
    return kRequestCommands;
}

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
