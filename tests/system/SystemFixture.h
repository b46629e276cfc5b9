#pragma once

#include "keystrand-sim/ControlClient.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace system_tests {

using support::Program;

/// A request as the kernel side logged it. The payload is shown without its control code.
struct Request {
    std::uint32_t control = 0;
    std::string payload;
    std::int64_t status = 0;

    friend bool operator==(const Request&, const Request&) = default;
    friend std::ostream& operator<<(std::ostream& out, const Request& request) {
        return out << "control " << request.control << " payload " << request.payload << " status "
                   << request.status;
    }
};

/// The real programs under a private root directory: the kernel side, the daemon, its supervisor.
class SystemFixture : public testing::Test {
  protected:
    SystemFixture() : SystemFixture(std::filesystem::temp_directory_path()) {}
    /// With the root directory below `parent`.
    explicit SystemFixture(const std::filesystem::path& parent);

    /// Starts the kernel side and connects to its control socket. It publishes nothing but what a
    /// test asks for, unless the options say otherwise.
    void startKernel(const std::vector<std::string>& options = {"--quiet"});
    void stopKernel();

    /// Sends a command to the kernel side, which must succeed; its lines are returned.
    std::vector<std::string> kernel(const std::string& command);
    /// The rest of the line of `status` that begins with `key`.
    std::string kernelStatus(const std::string& key);
    /// The control requests that the kernel side has received since `requests clear`.
    std::vector<Request> requests();

    /// The daemon with an event socket of its own, as it begins.
    std::unique_ptr<Program> beginDaemon(const std::vector<std::string>& options = {});
    /// The same, in its run loop when this returns.
    std::unique_ptr<Program> startDaemon(const std::vector<std::string>& options = {});

    /// The supervisor, which owns the event socket and launches a daemon for each event.
    std::unique_ptr<Program> startSupervisor(int idleMilliseconds, bool startAtOnce);

    /// Sends an event as any program would, waiting while the socket is full.
    void sendEvent(std::string_view name, std::string_view stream = "com.zerva.notifyd.matching");

    /// Replaces the settings file in one step.
    void putSettings(const std::string& text);

    void putFile(const std::string& path, const std::vector<std::uint8_t>& bytes);
    [[nodiscard]] std::optional<std::vector<std::uint8_t>> file(const std::string& path) const;
    [[nodiscard]] std::string real(const std::string& path) const {
        return root.path() / path.substr(1);
    }

    support::TemporaryDirectory root;
    std::unique_ptr<Program> kernelProgram;

  private:
    std::optional<keystrand::sim::ControlClient> control_;
    int sender_;
};

inline constexpr char kStateFile[] = "/var/root/.usbrestrictedmode_v2";
inline constexpr char kAnalyticsFile[] = "/var/root/.usbrestrictedmode_analytics";
inline constexpr char kDatabaseFile[] = "/var/root/.usbrestrictedmode_analytics_v2.db";

/// Lower-case hexadecimal.
[[nodiscard]] std::string hex(const std::vector<std::uint8_t>& bytes);
[[nodiscard]] std::string hex(std::string_view text);

/// The payload of an acknowledgement, in hexadecimal.
[[nodiscard]] std::string ackPayload(std::string_view property);

} // namespace system_tests
