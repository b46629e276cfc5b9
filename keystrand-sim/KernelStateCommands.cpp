#include "base/Concat.h"
#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/ControlCommand.h"

#include <array>

namespace keystrand::sim {

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
