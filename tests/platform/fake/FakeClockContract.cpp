#include "platform/fake/FakeClock.h"
#include "tests/platform/contract/ClockContract.h"

namespace contract {

namespace {

class FakeClockFixture final : public ClockFixture {
  public:
    FakeClockFixture() { clock_.set(kDate); }

    platform::Clock& clock() override { return clock_; }
    platform::Date reference() override { return kDate; }

  private:
    static constexpr platform::Date kDate{1};

    platform::FakeClock clock_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, ClockContract, (fixtureOf<ClockFixture, FakeClockFixture>()));

} // namespace contract
