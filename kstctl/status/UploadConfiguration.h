#pragma once

#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "platform/linux/Paths.h"

#include <string>
#include <vector>

namespace kstctl {

/// Where events go, as the next daemon will read it.
struct UploadConfiguration {
    kstd::AnalyticsConfiguration analytics;
    /// What is wrong with the files; a file that is wrong counts for nothing.
    std::vector<std::string> remarks;

    [[nodiscard]] static UploadConfiguration read(const platform::Paths& paths);
};

} // namespace kstctl
