#include "platform/fake/FakeSystemLog.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/linux/LinuxConfiguration.h"
#include "platform/linux/LinuxSystemVersion.h"
#include "tests/platform/contract/ConfigurationContract.h"
#include "tests/platform/linux/RootDirectory.h"

namespace contract {

namespace {

class LinuxUserDefaultsFixture final : public UserDefaultsFixture {
  public:
    LinuxUserDefaultsFixture() { root_.makeDirectory("/etc/kstd"); }

    platform::UserDefaults& defaults() override { return defaults_; }

    void put(const std::string& domain, const platform::ValueMap& content) override {
        std::string path = "/etc/kstd/";
        path += domain;
        path += ".plist";
        root_.put(path, propertyLists_.binary(content).value());
    }

  private:
    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::PropertyListCodec propertyLists_;
    platform::LinuxUserDefaults defaults_{root_.paths(), propertyLists_, log_};
};

class LinuxConfigurationResourceFixture final : public ConfigurationResourceFixture {
  public:
    LinuxConfigurationResourceFixture() { root_.makeDirectory("/usr/share/keystrand"); }

    platform::ConfigurationResource& resources() override { return resources_; }

    void put(const std::string& component, const std::string& name,
             const std::optional<platform::ValueMap>& content) override {
        ASSERT_EQ(component, "Keystrand");
        std::string path = "/usr/share/keystrand/";
        path += name;
        path += ".plist";
        if (content) {
            root_.put(path, propertyLists_.binary(*content).value());
        } else {
            std::filesystem::remove(root_.real(path));
        }
    }

  private:
    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::PropertyListCodec propertyLists_;
    platform::LinuxConfigurationResource resources_{root_.paths(), propertyLists_, log_};
};

class LinuxSystemVersionFixture final : public SystemVersionFixture {
  public:
    LinuxSystemVersionFixture() { root_.makeDirectory("/etc"); }

    platform::SystemVersion& version() override { return version_; }

    void put(const std::optional<std::string>& build,
             const std::optional<std::string>& product) override {
        std::string text = "ID=x\n";
        if (build) {
            text += "BUILD_ID='" + *build + "'\n";
        }
        if (product) {
            text += "NAME=\"" + *product + "\"\n";
        }
        root_.put("/etc/os-release", text);
    }

  private:
    support::RootDirectory root_;
    platform::LinuxSystemVersion version_{root_.paths()};
};

class LinuxInternalDiagnosticsFixture final : public InternalDiagnosticsFixture {
  public:
    LinuxInternalDiagnosticsFixture() { root_.makeDirectory("/etc/kstd/internal-diagnostics"); }

    platform::InternalDiagnostics& diagnostics() override { return diagnostics_; }

    void put(const std::string& subsystem, bool enabled) override {
        const std::string path = "/etc/kstd/internal-diagnostics/" + subsystem;
        if (enabled) {
            root_.put(path, "");
        } else {
            std::filesystem::remove(root_.real(path));
        }
    }

  private:
    support::RootDirectory root_;
    platform::LinuxInternalDiagnostics diagnostics_{root_.paths()};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, UserDefaultsContract,
                         (fixtureOf<UserDefaultsFixture, LinuxUserDefaultsFixture>()));
INSTANTIATE_TEST_SUITE_P(
    Linux, ConfigurationResourceContract,
    (fixtureOf<ConfigurationResourceFixture, LinuxConfigurationResourceFixture>()));
INSTANTIATE_TEST_SUITE_P(Linux, SystemVersionContract,
                         (fixtureOf<SystemVersionFixture, LinuxSystemVersionFixture>()));
INSTANTIATE_TEST_SUITE_P(
    Linux, InternalDiagnosticsContract,
    (fixtureOf<InternalDiagnosticsFixture, LinuxInternalDiagnosticsFixture>()));

} // namespace contract
