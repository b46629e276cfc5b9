#include "platform/linux/LinuxClock.h"
#include "tests/platform/contract/ClockContract.h"

#include <chrono>

namespace contract {

namespace {

class LinuxClockFixture final : public ClockFixture {
  public:
    platform::Clock& clock() override { return clock_; }

    platform::Date reference() override {
        const auto since1970 = std::chrono::system_clock::now().time_since_epoch();
        return {std::chrono::nanoseconds(since1970).count()};
    }

  private:
    platform::LinuxClock clock_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, ClockContract, (fixtureOf<ClockFixture, LinuxClockFixture>()));

} // namespace contract
