#pragma once

#include "kstctl/ExitStatus.h"
#include "kstctl/status/Section.h"
#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "platform/Date.h"
#include "platform/linux/Paths.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kstctl {

/// Where events go, as the next daemon will read it.
struct UploadConfiguration {
    kstd::AnalyticsConfiguration analytics;
    /// What is wrong with the files, which then count for nothing, and with the settings: the lines
    /// of the daemon.
    std::vector<std::string> remarks = {};
    /// What they come to: success when there are none.
    ExitStatus status = ExitStatus::success;

    [[nodiscard]] static UploadConfiguration read(const platform::Paths& paths);
};

/// What became of an upload.
enum class UploadOutcome {
    /// The server has the events.
    accepted,
    failed,
    /// There was no address for it.
    noAddress,
    /// There is nothing behind its start: it is under way, or the daemon was ended in it.
    begun,
};

/// What a line of the daemon's says about the upload that it ends, or begins; none when it says
/// nothing of that kind.
[[nodiscard]] std::optional<UploadOutcome> uploadOutcomeOf(std::string_view line);

/// Adds to the section, as "last", what became of the daemon's last upload: the daemon keeps it
/// nowhere but in the journal.
void addLastUpload(Section& section, const Environment& environment);

} // namespace kstctl
