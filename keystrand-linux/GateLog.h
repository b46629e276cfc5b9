#pragma once

#include "base/NotCopied.h"

#include <array>
#include <cstddef>
#include <string>
#include <string_view>

namespace keystrand::usb {

/// What a line of the gate is about; docs/keystrand-linux.md and
/// packaging/systemd/keystrand.catalog explain each.
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

/// How a line weighs, by the numbers of syslog.
enum class GateLevel : int { warning = 4, notice = 5, info = 6 };

struct GateLineClass {
    GateLine about;
    /// By which lines of the class are found in the journal. Never given to another class.
    std::string_view messageId;
    GateLevel level;
};

/// The one list of the classes, in the order of the enumeration.
inline constexpr std::array<GateLineClass, 16> kGateLineClasses = {{
    {GateLine::started, "e7c97ca44b444385908151ea66628a33", GateLevel::info},
    {GateLine::closed, "61c9be1c45e4413a8d246942e0508586", GateLevel::notice},
    {GateLine::opened, "8f2b7baafa264cc881885bd4a9b3599e", GateLevel::notice},
    {GateLine::refused, "d321045429b84f67887565f80911955b", GateLevel::notice},
    {GateLine::accepted, "3e47a923d5434ccd921883df787d8cb2", GateLevel::notice},
    {GateLine::left, "caf46da51d6f444391fcb930bb82e667", GateLevel::warning},
    {GateLine::cannotGuard, "affaf2f14d374473afd65a76e7187cdd", GateLevel::warning},
    {GateLine::writeFailed, "4526827a3d244396a82c8c35024cddde", GateLevel::warning},
    {GateLine::recordFailed, "5670f5e8d3ec47f18871a2d6abf4715a", GateLevel::warning},
    {GateLine::configuration, "5c5f003f62bb4c4aa80bd10152d13e72", GateLevel::warning},
    {GateLine::lockState, "69a48580ee014c35b9b9a8925a9b6270", GateLevel::info},
    {GateLine::listenerAway, "222310e8b1fe4a2ca8be5bcc7d987c23", GateLevel::warning},
    {GateLine::clock, "44c9c9e236324a1e8c5740844d5adcc2", GateLevel::notice},
    {GateLine::unacknowledged, "25c29fad13db4817ae10017b830e9b4d", GateLevel::warning},
    {GateLine::policyOff, "6171074c8aa647f39c61fcd6427301eb", GateLevel::notice},
    {GateLine::administrator, "53ef39c855ad45828847d8f3e287c3c8", GateLevel::notice},
}};

[[nodiscard]] constexpr const GateLineClass& classOf(GateLine about) {
    return kGateLineClasses[static_cast<std::size_t>(about)];
}

/// Where the gate's lines go.
class GateLog : private base::NotCopied {
  public:
    virtual ~GateLog() = default;

    /// One line, without its end; bytes of others are escaped already.
    virtual void write(GateLine about, const std::string& text) = 0;
};

} // namespace keystrand::usb
