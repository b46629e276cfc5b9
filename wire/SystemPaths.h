#pragma once

#include "base/Concat.h"

#include <string>
#include <string_view>

/// Where programs meet: each of these is written here and nowhere else in the code.
namespace wire {

/// What everything that lasts until the next start lies under.
inline constexpr char kRunDirectory[] = "/run";

/// The kernel side's, which it makes when it is not there.
inline constexpr char kKernelDirectory[] = "/run/keystrand";
inline constexpr char kKernelSocket[] = "/run/keystrand/service.sock";
/// Of the simulator alone.
inline constexpr char kSimulatorControlSocket[] = "/run/keystrand/control.sock";
/// Of the one that guards a machine's ports: what an administrator asks, and what
/// `keystrand-sessions` says.
inline constexpr char kGateSocket[] = "/run/keystrand/gate.sock";
inline constexpr char kSessionsSocket[] = "/run/keystrand/sessions.sock";

/// The daemon's.
inline constexpr char kDaemonDirectory[] = "/run/kstd";
inline constexpr char kEventSocket[] = "/run/kstd/events.sock";
inline constexpr char kAlarmHelperSocket[] = "/run/kstd/alarms.sock";
inline constexpr char kHTTPSSocket[] = "/run/kstd/https.sock";

/// An absolute path where it lies under a root directory; slashes at the root's end do not matter.
[[nodiscard]] inline std::string underRoot(std::string_view root, std::string_view absolutePath) {
    while (root.ends_with('/')) {
        root.remove_suffix(1);
    }
    while (absolutePath.starts_with('/')) {
        absolutePath.remove_prefix(1);
    }
    return base::concat(root, '/', absolutePath);
}

} // namespace wire
