#pragma once

#include "wire/SystemPaths.h"

#include <string>
#include <string_view>

namespace platform {

/// The absolute paths of the system, all under one root directory: "/" in the installed programs,
/// a private directory in development and tests.
class Paths {
  public:
    /// Where clients look for the kernel service, who know no other root than "/".
    static constexpr std::string_view kKernelSocket = wire::kKernelSocket;

    /// `root` is absolute; slashes at its end do not matter.
    explicit Paths(std::string_view root);

    /// `absolutePath`, a path as the programs know it, where it lies under the root.
    [[nodiscard]] std::string under(std::string_view absolutePath) const;

    [[nodiscard]] bool isSystemRoot() const { return prefix_.empty(); }

    [[nodiscard]] std::string eventSocket() const { return under(wire::kEventSocket); }
    [[nodiscard]] std::string alarmHelperSocket() const { return under(wire::kAlarmHelperSocket); }
    [[nodiscard]] std::string httpsSocket() const { return under(wire::kHTTPSSocket); }
    [[nodiscard]] std::string kernelSocket() const { return under(kKernelSocket); }
    [[nodiscard]] std::string managedSettingsDirectory() const { return under("/etc/kstd"); }
    [[nodiscard]] std::string managedSettings() const {
        return under("/etc/kstd/managed-settings.conf");
    }
    [[nodiscard]] std::string alarmDirectory() const { return under("/var/lib/kstd/alarms"); }
    [[nodiscard]] std::string systemBus() const { return under("/run/dbus/system_bus_socket"); }
    /// The journal of the whole system, which no other root has.
    static constexpr std::string_view kJournalSocket = "/run/systemd/journal/socket";
    [[nodiscard]] std::string stateDirectory() const { return under("/var/root"); }
    [[nodiscard]] std::string osRelease() const { return under("/etc/os-release"); }
    [[nodiscard]] std::string vendorOsRelease() const { return under("/usr/lib/os-release"); }

    // Each name is a plain file name.
    [[nodiscard]] std::string userDefaults(std::string_view domain) const;
    [[nodiscard]] std::string configurationResource(std::string_view component,
                                                    std::string_view name) const;
    [[nodiscard]] std::string internalDiagnostics(std::string_view subsystem) const;

  private:
    /// The root without a slash at its end; empty for "/".
    std::string prefix_;
};

/// Whether the text can be a file's name, or the first part of one, without leading out of the
/// directory.
[[nodiscard]] bool isPlainFileName(std::string_view name);

} // namespace platform
