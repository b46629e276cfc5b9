#include "keystrand-sim/FaultScript.h"

#include <algorithm>

namespace keystrand::sim {

namespace {

template <typename Wanted, typename Actual>
bool covers(const std::optional<Wanted>& wanted, const Actual& actual) {
    return !wanted || *wanted == actual;
}

void countDown(std::uint64_t& times) {
    if (times != FaultScript::kAlways) {
        --times;
    }
}

/// Counts one time of `order` and removes it when it has run out.
template <typename Order>
void use(std::vector<Order>& orders, typename std::vector<Order>::iterator order) {
    countDown(order->times);
    if (order->times == 0) {
        orders.erase(order);
    }
}

} // namespace

bool FaultMatch::matches(const RequestKind& request) const {
    return covers(operation, request.operation) && covers(command, request.command) &&
           covers(control, request.control);
}

bool FaultEffect::replacesHandling() const {
    return status || replySize || garbageSize || silence || hangUp;
}

bool FaultEffect::isNothing() const {
    return !replacesHandling() && !reported && !wrongSequence && delayMilliseconds == 0;
}

bool FaultScript::add(const FaultMatch& match, const FaultEffect& effect, std::uint64_t times) {
    if (faults_.size() == kMaxFaults) {
        return false;
    }
    faults_.push_back({match, effect, times});
    return true;
}

bool FaultScript::hideProperty(std::string_view name, std::uint64_t times) {
    if (hidden_.size() == kMaxFaults) {
        return false;
    }
    hidden_.push_back({std::string(name), times});
    return true;
}

std::optional<FaultEffect> FaultScript::take(const RequestKind& request) {
    const auto found = std::find_if(faults_.begin(), faults_.end(), [&](const Fault& fault) {
        return fault.match.matches(request);
    });
    if (found == faults_.end()) {
        return std::nullopt;
    }
    const FaultEffect effect = found->effect;
    use(faults_, found);
    return effect;
}

bool FaultScript::takeHiddenProperty(std::string_view name) {
    const auto found =
        std::find_if(hidden_.begin(), hidden_.end(),
                     [&](const HiddenProperty& hidden) { return hidden.name == name; });
    if (found == hidden_.end()) {
        return false;
    }
    use(hidden_, found);
    return true;
}

bool FaultScript::takeRefusal() {
    if (refusals_ == 0) {
        return false;
    }
    countDown(refusals_);
    return true;
}

std::size_t FaultScript::pending() const {
    return faults_.size() + hidden_.size() + (refusals_ > 0 ? 1U : 0U) + (entryPresent_ ? 0U : 1U);
}

} // namespace keystrand::sim
