#pragma once

#include "kstctl/ExitStatus.h"
#include "kstctl/Report.h"
#include "platform/Result.h"

#include <optional>
#include <string>
#include <utility>

namespace kstctl {

struct Environment;

/// One part of the status, and the worst that was found in it.
struct Section {
    Report report;
    std::optional<platform::Error> worst;

    /// Keeps the worse of two faults. From the worst on: missing, unreadable, malformed,
    /// misconfigured, failed.
    void note(const platform::Error& fault);

    /// Adds a value that could not be found out.
    void addUnknown(std::string name, const platform::Error& fault) {
        report.add(std::move(name), Report::Unknown{fault.description});
        note(fault);
    }

    /// Adds what is wrong with something that is there.
    void addProblem(const std::string& description) {
        report.add("problem", description);
        note(failure(ExitStatus::malformed, description));
    }
};

/// The permission bits of a file's mode, as four digits.
[[nodiscard]] std::string octalMode(unsigned mode);

/// The event socket, and the process behind it.
[[nodiscard]] Section daemonSection(const Environment& environment);
[[nodiscard]] Section stateFileSection(const Environment& environment);
[[nodiscard]] Section analyticsFileSection(const Environment& environment);
[[nodiscard]] Section alarmSection(const Environment& environment);
[[nodiscard]] Section settingsSection(const Environment& environment);
/// Empty on a machine without a gate in front of its USB ports.
[[nodiscard]] Section gateSection(const Environment& environment);
[[nodiscard]] Section databaseSection(const Environment& environment);
[[nodiscard]] Section uploadSection(const Environment& environment);

} // namespace kstctl
