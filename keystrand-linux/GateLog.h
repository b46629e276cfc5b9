#pragma once

#include <string>

namespace keystrand::usb {

/// What a line of the gate is about; docs/keystrand-linux.md and the catalog explain each.
enum class GateLine {
    started,
    closed,
    opened,
    refused,
    accepted,
    left,
    cannotGuard,
    writeFailed,
    recordFailed,
    configuration,
    lockState,
    listenerAway,
    clock,
    unacknowledged,
    policyOff,
    administrator,
};

/// Where the gate's lines go.
class GateLog {
  public:
    GateLog() = default;
    GateLog(const GateLog&) = delete;
    GateLog& operator=(const GateLog&) = delete;
    virtual ~GateLog() = default;

    /// One line, without its end; bytes of others are escaped already.
    virtual void write(GateLine about, const std::string& text) = 0;
};

} // namespace keystrand::usb
