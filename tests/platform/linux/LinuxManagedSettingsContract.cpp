#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxManagedSettings.h"
#include "tests/platform/contract/ManagedSettingsContract.h"
#include "tests/platform/linux/RootDirectory.h"

#include <filesystem>

namespace contract {

namespace {

constexpr char kPath[] = "/etc/kstd/managed-settings.conf";

class LinuxManagedSettingsFixture final : public ManagedSettingsFixture {
  public:
    LinuxManagedSettingsFixture() { root_.makeDirectory("/etc/kstd"); }

    platform::ManagedSettings& settings() override { return settings_; }

    void put(std::optional<bool> allowed) override {
        if (allowed) {
            root_.put(kPath, *allowed ? "restricted-mode-allowed = yes\n"
                                      : "restricted-mode-allowed = no\n");
        } else {
            std::filesystem::remove(root_.real(kPath));
        }
    }

  private:
    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::LinuxManagedSettings settings_{root_.paths(), log_};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, ManagedSettingsContract,
                         (fixtureOf<ManagedSettingsFixture, LinuxManagedSettingsFixture>()));

} // namespace contract
