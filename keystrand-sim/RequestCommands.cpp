#include "base/Concat.h"
#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/ControlCommand.h"

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

} // namespace keystrand::sim
