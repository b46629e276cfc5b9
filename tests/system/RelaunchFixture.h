#pragma once

#include "tests/support/SystemCallGate.h"
#include "tests/system/AnalyticsFixture.h"

#include <memory>
#include <string>
#include <vector>

namespace system_tests {

/// The daemon as the init system launches it: the event socket is handed over, and outlives it with
/// what waits in it. All lies in memory, where syncs cost nothing.
class RelaunchFixture : public AnalyticsFixture {
  protected:
    RelaunchFixture();
    ~RelaunchFixture() override;

    /// A daemon, and one that shows its system calls.
    [[nodiscard]] std::unique_ptr<Program> relaunched() const;
    [[nodiscard]] std::unique_ptr<support::SystemCallGate>
    relaunchedBehind(support::SystemCallGate::Judge judge) const;

    /// Where events wait. A program that is started in `handOver` finds it as the init system's.
    [[nodiscard]] int eventSocket() const { return eventSocket_; }
    /// Takes out what waits.
    void dropEvents() const;

    [[nodiscard]] int acks() { return std::stoi(kernelStatus("acks")); }

    /// Further words for the daemon.
    std::vector<std::string> options;

    /// A state file's content.
    [[nodiscard]] static std::vector<std::uint8_t> stateOf(std::uint8_t version) {
        return {version, 0, 0, 0, 0x00, 0xd2, 0x49, 0x6b, 0, 0, 0, 0, 1};
    }

  private:
    void handOver() const;
    [[nodiscard]] std::vector<std::string> words() const;

    int eventSocket_;
};

} // namespace system_tests
