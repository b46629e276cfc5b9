#pragma once

#include "bench/support/PrivateRoot.h"
#include "kstd/Analytics/Analytics.h"
#include "platform/linux/LinuxHost.h"

#include <filesystem>
#include <memory>
#include <string>

namespace bench {

/// The daemon's event logger on the Linux host, under a root of its own: what the product is in the
/// benchmarks of events. One at a time in a process.
class AnalyticsProduct {
  public:
    explicit AnalyticsProduct(const std::filesystem::path& root)
        : host_({.paths = makePrivateRoot(root)}),
          logger_(kstd::Analytics::logger(host_.interfaces())) {}

    [[nodiscard]] kstd::Analytics& logger() { return *logger_; }
    [[nodiscard]] platform::Host host() { return host_.interfaces(); }

    /// Where the events of a product under that root are stored.
    [[nodiscard]] static std::string databaseUnder(const std::filesystem::path& root) {
        return platform::Paths(root.string()).under(*kstd::Analytics::databasePath());
    }

  private:
    platform::LinuxHost host_;
    kstd::AnalyticsLifetime lifetime_;
    std::shared_ptr<kstd::Analytics> logger_;
};

} // namespace bench
