#pragma once

#include "base/NotCopied.h"
#include "kstd/KSTService.h"
#include "kstd/LogLines.h"
#include "platform/Host.h"

#include <memory>
#include <string_view>
#include <vector>

namespace kstd {

/// The daemon's life: makes and starts its services, hands them the events of the two matching
/// streams by name, runs the main run loop until it has no source left, and stops the services.
class Daemon {
  public:
    using Services = std::vector<std::shared_ptr<KSTService>>;

    /// What the host refers to must outlive the daemon. The services are started and stopped in
    /// the order of the list.
    Daemon(const platform::Host& host, Services services);

    /// Returns the process's exit status, which is 0: the run loop having no sources is the only
    /// way out.
    [[nodiscard]] int run();

  private:
    struct MatchingStream;

    void startServices();
    void subscribe(const MatchingStream& stream);
    void stopServices();

    platform::Host host_;
    std::shared_ptr<const Services> services_;
};

/// The services of this system: one DeviceRestrictedModeService, which has subscribed to its alarm
/// stream when this returns.
[[nodiscard]] Daemon::Services makeServices(const platform::Host& host);

/// KSTLib in this process on the daemon's host, as long as it lives: what the services call of it
/// works, and of its lines, those that an operator can act on have their class.
class DaemonLibrary : private base::NotCopied {
  public:
    /// What the host refers to must outlive it.
    explicit DaemonLibrary(const platform::Host& host);
    ~DaemonLibrary();

  private:
    ClassifyingLog log_;
};

} // namespace kstd
