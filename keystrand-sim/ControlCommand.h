#pragma once

#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/RequestLog.h"
#include "keystrand/Commands.h"
#include "keystrand/EventSender.h"
#include "keystrand/KernelSocketServer.h"
#include "keystrand/ModelClock.h"
#include "keystrand/NotificationPublisher.h"
#include "keystrand/RestrictedModeController.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::sim {

/// The system's clock, until it is set by hand: then it stands still where it was set.
class ManualClock final : public DateClock {
  public:
    explicit ManualClock(std::optional<Seconds> manual) : manual_(manual) {}

    [[nodiscard]] bool isManual() const { return manual_.has_value(); }
    [[nodiscard]] Seconds now() const override { return manual_ ? *manual_ : DateClock::now(); }
    void set(Seconds time) { manual_ = time; }
    void setReal() { manual_.reset(); }

  private:
    std::optional<Seconds> manual_;
};

/// What control commands work on.
struct ControlContext {
    KernelState& kernel;
    ManualClock& clock;
    RestrictedModeController& restrictedMode;
    NotificationPublisher& publisher;
    EventSender& events;
    FaultScript& faults;
    RequestLog& requests;
    const KernelSocketServer& server;
};

/// A count of the request log that a client waits for.
struct WaitCondition {
    enum class Count { requests, acknowledgements, control };
    Count count = Count::requests;
    std::uint32_t control = 0;
    std::uint64_t total = 0;
    std::chrono::milliseconds timeout{10'000};

    [[nodiscard]] bool isMet(const RequestLog& log) const;
};

/// What is to be answered, and what else is to be done.
struct ControlOutcome {
    std::vector<std::string> lines;
    /// Empty for success.
    std::string error;
    /// The answer is due when this is met.
    std::optional<WaitCondition> wait;
    bool quit = false;

    [[nodiscard]] static ControlOutcome done() { return {}; }
    [[nodiscard]] static ControlOutcome failed(std::string reason);
};

/// One command of the control socket. `name` is one or two words.
struct ControlCommand {
    std::string_view name;
    std::string_view usage;
    ControlOutcome (*run)(ControlContext& context, ControlArguments& arguments);
};

/// The commands, a file of source for each kind.
[[nodiscard]] std::span<const ControlCommand> timerCommands();
[[nodiscard]] std::span<const ControlCommand> publishCommands();
[[nodiscard]] std::span<const ControlCommand> kernelStateCommands();
[[nodiscard]] std::span<const ControlCommand> clientStateCommands();
[[nodiscard]] std::span<const ControlCommand> requestCommands();
[[nodiscard]] std::span<const ControlCommand> faultCommands();

/// Carries out one line.
[[nodiscard]] ControlOutcome runControlLine(ControlContext& context, std::string_view line);

} // namespace keystrand::sim
