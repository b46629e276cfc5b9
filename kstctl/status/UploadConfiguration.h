#pragma once

#include "kstctl/ExitStatus.h"
#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "platform/linux/Paths.h"

#include <string>
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

} // namespace kstctl
