#include "keystrand-sim/ControlCommand.h"

#include "base/Concat.h"

#include <array>
#include <utility>

namespace keystrand::sim {

namespace {

ControlOutcome help(ControlContext& /*context*/, ControlArguments& arguments);

ControlOutcome quit(ControlContext& /*context*/, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    outcome.quit = true;
    return outcome;
}

constexpr std::array kProgramCommands = {
    ControlCommand{"help", "", help},
    ControlCommand{"quit", "", quit},
};

std::array<std::span<const ControlCommand>, 7> allCommands() {
    return {timerCommands(),   publishCommands(), kernelStateCommands(), clientStateCommands(),
            requestCommands(), faultCommands(),   kProgramCommands};
}

ControlOutcome help(ControlContext& /*context*/, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    for (const auto& group : allCommands()) {
        for (const ControlCommand& command : group) {
            outcome.lines.push_back(
                base::concat(command.name, command.usage.empty() ? "" : " ", command.usage));
        }
    }
    return outcome;
}

/// Takes the words of the command's name from the arguments when they are there.
bool takesName(ControlArguments& arguments, std::string_view name) {
    ControlArguments remaining = arguments;
    for (ControlArguments words(name); words.hasWord();) {
        if (!remaining.hasWord() || remaining.word(name) != words.word(name)) {
            return false;
        }
    }
    arguments = std::move(remaining);
    return true;
}

} // namespace

bool WaitCondition::isMet(const RequestLog& log) const {
    switch (count) {
    case Count::requests:
        return log.count() >= total;
    case Count::acknowledgements:
        return log.acknowledgements() >= total;
    case Count::control:
        break;
    }
    return log.controlCount(control) >= total;
}

ControlOutcome ControlOutcome::failed(std::string reason) {
    ControlOutcome outcome;
    outcome.error = std::move(reason);
    return outcome;
}

ControlOutcome runControlLine(ControlContext& context, std::string_view line) {
    ControlArguments arguments(line);
    for (const auto& group : allCommands()) {
        for (const ControlCommand& command : group) {
            if (takesName(arguments, command.name)) {
                return command.run(context, arguments);
            }
        }
    }
    return ControlOutcome::failed("unknown command");
}

} // namespace keystrand::sim
