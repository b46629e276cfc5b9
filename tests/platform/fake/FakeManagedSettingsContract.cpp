#include "platform/fake/FakeConfiguration.h"
#include "tests/platform/contract/ManagedSettingsContract.h"

namespace contract {

namespace {

class FakeManagedSettingsFixture final : public ManagedSettingsFixture {
  public:
    platform::ManagedSettings& settings() override { return settings_; }
    void put(std::optional<bool> allowed) override { settings_.put(allowed); }

  private:
    platform::FakeManagedSettings settings_{[] {
    }};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, ManagedSettingsContract,
                         (fixtureOf<ManagedSettingsFixture, FakeManagedSettingsFixture>()));

} // namespace contract
