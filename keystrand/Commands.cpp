#include "keystrand/Commands.h"

#include "KSTLib/Command.h"
#include "base/ByteReader.h"

#include <cassert>

namespace keystrand {

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr std::size_t kNumberSize = sizeof(std::uint32_t);

/// Every command of this file begins with a number; the table has checked that it is there.
struct NumberedPayload {
    explicit NumberedPayload(Payload payload) {
        base::ByteReader reader(payload);
        [[maybe_unused]] const bool fits = reader.readU32(number);
        assert(fits);
        rest = reader.rest();
    }

    std::uint32_t number = 0;
    Payload rest;
};

CommandResult setVariable(NumberedValues& environment, Payload payload) {
    const NumberedPayload variable(payload);
    if (!environment.set(variable.number, variable.rest)) {
        return endedWith(kKernelTableFull);
    }
    return {};
}

CommandResult getVariable(const NumberedValues& environment, Payload payload) {
    const Payload value = environment.get(NumberedPayload(payload).number);
    return {.status = kKernelSuccess, .output = {value.begin(), value.end()}};
}

CommandResult kernelControl(const DispatchTable& controls, Payload payload) {
    const NumberedPayload control(payload);
    return controls.run(control.number, control.rest);
}

} // namespace

DispatchTable makeServiceCommands(KernelState& kernel, const DispatchTable& kernelControls) {
    DispatchTable table;
    table.add(kKSTCommandSetEnvironmentVariable,
              {.min = kNumberSize, .max = kNumberSize + kKSTEnvironmentVariableMaxSize},
              [&](Payload payload) { return setVariable(kernel.environment, payload); });
    table.add(kKSTCommandGetEnvironmentVariable, {.min = kNumberSize, .max = kNumberSize},
              [&](Payload payload) { return getVariable(kernel.environment, payload); });
    table.add(kKSTCommandKernelControl,
              {.min = kNumberSize, .max = kNumberSize + kKSTKernelControlMaxSize},
              [&](Payload payload) { return kernelControl(kernelControls, payload); });
    return table;
}

DispatchTable makeCommands(KernelState& kernel, const Now& now,
                           const DispatchTable& kernelControls) {
    DispatchTable table = makeServiceCommands(kernel, kernelControls);
    addContextCommands(table, kernel);
    addCredentialCommands(table, kernel, now);
    addPolicyCommands(table, kernel, now);
    addAccessListCommand(table, kernel);
    return table;
}

} // namespace keystrand
