#pragma once

#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/RequestLog.h"
#include "keystrand/RequestHandler.h"

namespace keystrand::sim {

/// Answers as the kernel side does but where a fault was ordered, and keeps a log of the struct
/// calls.
class FaultyRequestHandler final : public RequestHandler {
  public:
    /// Faults and log outlive the handler.
    FaultyRequestHandler(const Parts& parts, FaultScript& faults, RequestLog& log)
        : RequestHandler(parts), faults_(faults), log_(log) {}

    [[nodiscard]] RequestOutcome handle(std::span<const std::uint8_t> packet,
                                        ConnectionState& connection) override;

  protected:
    [[nodiscard]] bool hasEntry() const override { return faults_.entryPresent(); }
    [[nodiscard]] bool hidesProperty(std::string_view name) override {
        return faults_.takeHiddenProperty(name);
    }

  private:
    static void replace(Reply& reply, const FaultEffect& effect);
    [[nodiscard]] static RequestOutcome answer(const wire::KernelRequestHeader& request,
                                               const Reply& reply, const FaultEffect& effect);

    FaultScript& faults_;
    RequestLog& log_;
};

} // namespace keystrand::sim
