#pragma once

#include "base/Concat.h"
#include "keystrand-linux/GatePolicy.h"
#include "tests/keystrand-linux/FakeUsbBus.h"

#include <functional>
#include <map>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace keystrand::usb {

/// The policy on a bus, with a clock that a test moves: looks, writes what is decided, and looks
/// again, as the service does.
class GateOnBus {
  public:
    GateOnBus(FakeUsbBus& bus, const GateRules& rules, BootTime now = std::chrono::seconds(1000))
        : policy(rules), bus_(bus), now_(now) {}

    void close() {
        policy.close(look(), now_);
        settle();
    }
    void open() {
        policy.open();
        settle();
    }
    void keepOnly(const GatePolicy::IsKnown& isKnown) {
        policy.keepOnly(isKnown, look(), now_);
        settle();
    }

    /// Until nothing is left to be done; that it ends is what is tested, too.
    void settle() {
        for (int round = 0; step(); ++round) {
            if (round == 50) {
                throw std::logic_error("no end of decisions");
            }
        }
    }

    /// One look and what follows from it. False when nothing did.
    bool step() {
        const auto actions = policy.decide(look(), now_);
        for (const GateAction& action : actions) {
            happen();
            policy.carriedOut(action, carryOut(action), now_);
        }
        return !actions.empty();
    }

    void pass(BootTime time) {
        now_ += time;
        settle();
    }

    /// What happens before the next write, or the one after that, and so on.
    void meanwhile(unsigned beforeWrite, std::function<void()> what) {
        meanwhile_[writes_ + beforeWrite] = std::move(what);
    }

    [[nodiscard]] BootTime now() const { return now_; }
    [[nodiscard]] std::optional<Standing> standingAt(const std::string& port) const {
        const KnownDevice* const known = policy.find(bus_.attachmentAt(port));
        return known == nullptr ? std::nullopt : std::optional(known->standing);
    }

    GatePolicy policy;
    /// Devices that were told to be out without a write.
    std::vector<std::string> told;

  private:
    BusView look() {
        std::string problem;
        return bus_.look(problem).value();
    }

    void happen() {
        const auto found = meanwhile_.find(++writes_);
        if (found != meanwhile_.end()) {
            std::exchange(found->second, nullptr)();
            meanwhile_.erase(found);
        }
    }

    GateOutcome carryOut(const GateAction& action) {
        switch (action.kind) {
        case GateAction::Kind::setParameter:
            return bus_.setParameter(action.value);
        case GateAction::Kind::setRootHub:
            return bus_.setRootHub(action.hub, action.value);
        case GateAction::Kind::accept:
            return bus_.accept(action.device);
        case GateAction::Kind::refuse:
            return bus_.refuse(action.device);
        case GateAction::Kind::stayOut:
            told.push_back(base::concat(action.device.port(), " stays out"));
            return {};
        }
        return {};
    }

    FakeUsbBus& bus_;
    BootTime now_;
    unsigned writes_ = 0;
    std::map<unsigned, std::function<void()>> meanwhile_;
};

} // namespace keystrand::usb
