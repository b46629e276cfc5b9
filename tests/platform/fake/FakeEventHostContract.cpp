#include "platform/fake/FakeHost.h"
#include "tests/platform/contract/EventHostContract.h"

#include <memory>

namespace contract {

namespace {

class FakeEventHostFixture final : public EventHostFixture {
  public:
    platform::EventStream& events() override { return process_->events.events(); }
    platform::AlarmEvent& alarms() override { return process_->events.alarms(); }
    platform::MainRunLoop& runLoop() override { return process_->events.runLoop(); }
    platform::ProcessTransactions& transactions() override {
        return process_->events.transactions();
    }
    platform::Date now() override { return machine_.clock.now(); }
    void post(std::string_view stream, std::string_view name) override {
        process_->events.post(stream, name);
    }
    void changeSetting(bool restrictedModeAllowed) override {
        process_->settings.change(restrictedModeAllowed);
    }
    platform::ManagedSettings& settings() override { return process_->settings; }
    bool hasTransactions() override { return process_->events.transactions().count() > 0; }
    void closeSources() override { process_->events.closeSources(); }
    void restart() override {
        process_.reset();
        process_ = std::make_unique<platform::FakeHost>(machine_);
    }

  private:
    platform::FakeMachine machine_;
    std::unique_ptr<platform::FakeHost> process_ = std::make_unique<platform::FakeHost>(machine_);
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, EventHostContract,
                         (fixtureOf<EventHostFixture, FakeEventHostFixture>()));

} // namespace contract
