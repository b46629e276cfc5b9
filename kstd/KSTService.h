#pragma once

#include "base/NotCopied.h"
#include "platform/Host.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kstd {

/// Base class of every service that the daemon hosts. It has no state of its own. All operations
/// are called on the main thread.
class KSTService : private base::NotCopied {
  public:
    /// What the host refers to must outlive the service.
    explicit KSTService(const platform::Host& host) : host_(host) {}
    virtual ~KSTService() = default;

    /// Called once, before any event is delivered. The base does nothing.
    virtual void start() {}

    /// Called once, when the run loop has ended. The base does nothing.
    virtual void stop() {}

    /// Called for every event of the matching streams, also for names that are nobody's. The base
    /// does nothing.
    virtual void handleWispEventWithName(std::string_view /*eventName*/) {}

    /// The property of the kernel service's registry entry as it stands now, or none (with an
    /// assertion line) when the entry or the property is not there. A property that is there may
    /// be empty. The entry is looked up anew on every call.
    [[nodiscard]] std::optional<std::vector<std::uint8_t>>
    KSTPropertyWithName(std::string_view propertyName);

    /// Names the service in the log.
    [[nodiscard]] virtual std::string description() const = 0;

  protected:
    [[nodiscard]] const platform::Host& host() const { return host_; }

  private:
    const platform::Host host_;
};

} // namespace kstd
