#pragma once

#include "base/FileDescriptor.h"
#include "kstctl/Report.h"
#include "platform/Date.h"
#include "platform/Result.h"
#include "platform/linux/Paths.h"
#include "wire/GateMessages.h"

#include <chrono>
#include <span>
#include <string>
#include <string_view>
#include <utility>

namespace kstctl {

/// A connection to the gate in front of the machine's USB ports.
class GateClient {
  public:
    /// Letting a device in takes the kernel a while.
    static constexpr std::chrono::seconds kPatience{30};

    /// ExitStatus::missing: there is no such socket, or nobody listens on it.
    [[nodiscard]] static platform::Result<GateClient>
    connect(const platform::Paths& paths, std::chrono::milliseconds patience = kPatience);

    [[nodiscard]] platform::Result<wire::GateDevices> devices();
    [[nodiscard]] platform::Result<wire::GateStatus> status();
    /// For what is answered without more; what the gate refuses is ExitStatus::failed.
    [[nodiscard]] platform::Result<wire::GateDone> order(const wire::GateRequest& request);

  private:
    GateClient(base::FileDescriptor connection, std::chrono::milliseconds patience)
        : connection_(std::move(connection)), patience_(patience) {}

    [[nodiscard]] platform::Result<wire::GateAnswer> ask(const wire::GateRequest& request);
    template <typename Answer>
    [[nodiscard]] platform::Result<Answer> askFor(const wire::GateRequest& request);
    [[nodiscard]] bool awaitAnswer() const;

    base::FileDescriptor connection_;
    std::chrono::milliseconds patience_;
};

/// Whether this machine has a gate: its socket is there, whoever may use it.
[[nodiscard]] bool isGateThere(const platform::Paths& paths);

/// Why the gate lets a device in or keeps it out: the word of its answers, and words for people.
struct GateRule {
    std::string_view word;
    std::string_view meaning;
};
[[nodiscard]] std::span<const GateRule> gateRules();
/// Empty for a word that is not among them.
[[nodiscard]] std::string_view meaningOfGateRule(std::string_view word);

/// Since when its rule has held; empty while the gate is open, when there is none.
[[nodiscard]] std::string sinceText(const wire::GateDevice& device, platform::Date now);
/// "0781:5567"
[[nodiscard]] std::string idText(const wire::GateDevice& device);
/// What it is: port, number, inode, and what it says about itself.
[[nodiscard]] Report deviceIdentity(const wire::GateDevice& device);
/// That, whether it is accepted, by which rule, and since when.
[[nodiscard]] Report deviceReport(const wire::GateDevice& device, platform::Date now);

} // namespace kstctl
