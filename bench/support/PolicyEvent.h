#pragma once

#include "platform/Value.h"

#include <cstdint>

namespace bench {

/// What the daemon says about the policy in an event, with `number` in the field that changes most.
[[nodiscard]] inline platform::ValueMap policyAttributes(std::uint32_t number) {
    constexpr std::uint8_t kNo = 0;
    return {{"eventVersion", std::int32_t{3}},       {"restrictedMode", std::uint8_t{1}},
            {"restrictedModeDuration", number},      {"policyEnabled", std::int32_t{1}},
            {"policyDisabledByPasscodeNotSet", kNo}, {"policyDisabledByBootArg", kNo},
            {"policyDisabledByQuorvane", kNo},       {"eventPeriodDuration", std::uint32_t{86400}}};
}

} // namespace bench
