#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/Output.h"
#include "kstctl/status/GateClient.h"
#include "platform/linux/LinuxClock.h"

#include <algorithm>

namespace kstctl {

namespace {

/// Maker and name, as far as the device says them.
std::string productText(const wire::GateDevice& device) {
    const bool isBoth = !device.manufacturer.empty() && !device.name.empty();
    return base::concat(device.manufacturer, isBoth ? " " : "", device.name);
}

std::string ruleText(const wire::GateDevice& device) {
    const std::string_view meaning = meaningOfGateRule(device.rule);
    return meaning.empty() ? device.rule : std::string(meaning);
}

void showTable(const wire::GateDevices& devices, platform::Date now, Output& output) {
    const auto rowOf = [now](const wire::GateDevice& device) {
        return Row{device.port,
                   idText(device),
                   device.accepted ? "accepted" : "refused",
                   sinceText(device, now),
                   productText(device),
                   ruleText(device)};
    };
    Table table({"PORT", "ID", "STATE", "SINCE", "PRODUCT", "RULE"}, output.width());
    for (const wire::GateDevice& device : devices) {
        table.measure(rowOf(device));
    }
    output.put(table.headingLines(output.colours()));
    for (const wire::GateDevice& device : devices) {
        output.put(table.lines(rowOf(device)));
    }
}

ExitStatus show(const wire::GateDevices& devices, Output& output) {
    const platform::Date now = platform::realTimeNow();
    if (output.isJSON()) {
        Data list;
        for (const wire::GateDevice& device : devices) {
            list.emplace_back(deviceReport(device, now));
        }
        output.show(Report().add("devices", std::move(list)));
    } else {
        showTable(devices, now, output);
    }
    return output.finish(ExitStatus::success);
}

/// The device that was listed, and no other one that has come to its port since.
ExitStatus accept(const std::string& port, const wire::GateDevices& devices, GateClient& gate,
                  Output& output) {
    const auto found =
        std::find_if(devices.begin(), devices.end(),
                     [&](const wire::GateDevice& device) { return device.port == port; });
    if (found == devices.end()) {
        return output.finish(
            failure(ExitStatus::missing, base::concat("there is no device at port ", port)));
    }
    if (found->accepted) {
        return output.finish(failure(
            ExitStatus::failed, base::concat("the device at port ", port, " is accepted already")));
    }
    const auto done = gate.order(wire::GateAcceptRequest{
        .port = found->port, .number = found->number, .inode = found->inode});
    if (!done) {
        return output.finish(done.error());
    }
    output.show(deviceIdentity(*found).add("isAccepted", true));
    return output.finish(ExitStatus::success);
}

} // namespace

ExitStatus run(const DevicesCommand& command, const Environment& environment) {
    auto connected = GateClient::connect(environment.paths);
    if (!connected) {
        return environment.output.finish(connected.error());
    }
    GateClient gate = std::move(connected).value();
    const auto devices = gate.devices();
    if (!devices) {
        return environment.output.finish(devices.error());
    }
    return command.toAccept ? accept(*command.toAccept, devices.value(), gate, environment.output)
                            : show(devices.value(), environment.output);
}

ExitStatus run(const OpenCommand& command, const Environment& environment) {
    auto connected = GateClient::connect(environment.paths);
    if (!connected) {
        return environment.output.finish(connected.error());
    }
    GateClient gate = std::move(connected).value();
    const auto done = gate.order(wire::GateOpenRequest{.seconds = command.seconds});
    if (!done) {
        return environment.output.finish(done.error());
    }
    const platform::Date end{platform::realTimeNow().nanosecondsSince1970 +
                             command.seconds * platform::kNanosecondsPerSecond};
    environment.output.show(Report().add(
        "seconds", command.seconds,
        command.seconds > 0 ? base::concat("open until ", timeText(end)) : "no longer opened"));
    return environment.output.finish(ExitStatus::success);
}

} // namespace kstctl
