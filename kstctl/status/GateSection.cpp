#include "base/Concat.h"
#include "kstctl/Output.h"
#include "kstctl/status/GateClient.h"
#include "kstctl/status/Section.h"
#include "platform/linux/LinuxClock.h"
#include "wire/SystemPaths.h"

#include <string_view>

namespace kstctl {

namespace {

constexpr char kNotClosed[] = "it could not be closed";

void join(std::string& text, bool isSo, std::string_view part) {
    if (isSo) {
        text += base::concat(text.empty() ? "" : ", ", part);
    }
}

std::string whyOff(const wire::GateStatus& status) {
    std::string reasons;
    join(reasons, !status.allowed, "the management does not allow it");
    join(reasons, !status.passwordSet, "the user has no password");
    join(reasons, status.bootArgument, "the kernel's command line says so");
    return reasons;
}

std::string whyClosed(const wire::GateStatus& status) {
    std::string reasons;
    join(reasons, status.restricted, "restricted mode");
    join(reasons, status.sleeping, "the machine sleeps");
    join(reasons, status.starting, "the machine has just started");
    return reasons;
}

std::string whyOpen(const wire::GateStatus& status) {
    if (status.untilClosed) {
        return "by an administrator";
    }
    if (!whyOff(status).empty()) {
        return "the policy is off";
    }
    return whyClosed(status).empty() ? std::string() : kNotClosed;
}

const char* modeOf(const wire::GateStatus& status) {
    if (status.gap.empty() || (!status.closed && whyOpen(status) == kNotClosed)) {
        return status.closed ? "closed" : "open";
    }
    return status.closed ? "partly closed" : "partly open";
}

void addSeconds(Report& report, const char* name, const std::optional<std::uint64_t>& seconds,
                platform::Date now) {
    if (!seconds) {
        report.add(name, Report::None());
        return;
    }
    const std::int64_t since1970 = now.nanosecondsSince1970 / platform::kNanosecondsPerSecond;
    report.add(name, *seconds, timeText(static_cast<std::uint64_t>(since1970) + *seconds));
}

void addStatus(Report& report, const wire::GateStatus& status, platform::Date now) {
    const std::string off = whyOff(status);
    report.add("mode", modeOf(status), status.closed ? whyClosed(status) : whyOpen(status))
        .add("isRestricted", status.restricted)
        .add("isStarting", status.starting)
        .add("isSleeping", status.sleeping)
        .add("isLocked", status.locked);
    addSeconds(report, "untilRestricted", status.untilRestricted, now);
    addSeconds(report, "untilClosed", status.untilClosed, now);
    if (!status.gap.empty()) {
        report.add("exceptions", status.gap);
    }
    report.add("policy", off.empty() ? "on" : "off", off).add("refused", status.refused);
}

void addRefused(Section& section, GateClient& client, platform::Date now) {
    const auto devices = client.devices();
    if (!devices) {
        section.addUnknown("refusedDevices", devices.error());
        return;
    }
    Data refused;
    for (const wire::GateDevice& device : devices.value()) {
        if (!device.accepted) {
            refused.emplace_back(deviceReport(device, now));
        }
    }
    section.report.add("refusedDevices", std::move(refused));
}

} // namespace

Section gateSection(const Environment& environment) {
    Section section;
    if (!isGateThere(environment.paths)) {
        return section;
    }
    section.report.add("path", environment.paths.under(wire::kGateSocket));
    auto connected = GateClient::connect(environment.paths);
    if (!connected) {
        section.addUnknown("mode", connected.error());
        return section;
    }
    GateClient client = std::move(connected).value();
    const auto status = client.status();
    if (!status) {
        section.addUnknown("mode", status.error());
        return section;
    }
    const platform::Date now = platform::realTimeNow();
    addStatus(section.report, status.value(), now);
    addRefused(section, client, now);
    return section;
}

} // namespace kstctl
