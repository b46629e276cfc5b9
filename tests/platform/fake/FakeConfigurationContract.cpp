#include "platform/fake/FakeConfiguration.h"
#include "tests/platform/contract/ConfigurationContract.h"

namespace contract {

namespace {

class FakeUserDefaultsFixture final : public UserDefaultsFixture {
  public:
    platform::UserDefaults& defaults() override { return defaults_; }

    void put(const std::string& domain, const platform::ValueMap& content) override {
        for (const auto& [key, value] : content_[domain]) {
            defaults_.remove(domain, key);
        }
        for (const auto& [key, value] : content) {
            defaults_.set(domain, key, value);
        }
        content_[domain] = content;
    }

  private:
    platform::FakeUserDefaults defaults_;
    std::map<std::string, platform::ValueMap> content_;
};

class FakeConfigurationResourceFixture final : public ConfigurationResourceFixture {
  public:
    platform::ConfigurationResource& resources() override { return resources_; }

    void put(const std::string& component, const std::string& name,
             const std::optional<platform::ValueMap>& content) override {
        if (content) {
            resources_.put(component, name, *content);
        } else {
            resources_.remove(component, name);
        }
    }

  private:
    platform::FakeConfigurationResource resources_;
};

class FakeSystemVersionFixture final : public SystemVersionFixture {
  public:
    platform::SystemVersion& version() override { return version_; }

    void put(const std::optional<std::string>& build,
             const std::optional<std::string>& product) override {
        version_.setBuild(build);
        version_.setProduct(product);
    }

  private:
    platform::FakeSystemVersion version_;
};

class FakeInternalDiagnosticsFixture final : public InternalDiagnosticsFixture {
  public:
    platform::InternalDiagnostics& diagnostics() override { return diagnostics_; }

    void put(const std::string& subsystem, bool enabled) override {
        if (enabled) {
            diagnostics_.enable(subsystem);
        } else {
            diagnostics_.disable(subsystem);
        }
    }

  private:
    platform::FakeInternalDiagnostics diagnostics_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, UserDefaultsContract,
                         (fixtureOf<UserDefaultsFixture, FakeUserDefaultsFixture>()));
INSTANTIATE_TEST_SUITE_P(
    Fake, ConfigurationResourceContract,
    (fixtureOf<ConfigurationResourceFixture, FakeConfigurationResourceFixture>()));
INSTANTIATE_TEST_SUITE_P(Fake, SystemVersionContract,
                         (fixtureOf<SystemVersionFixture, FakeSystemVersionFixture>()));
INSTANTIATE_TEST_SUITE_P(Fake, InternalDiagnosticsContract,
                         (fixtureOf<InternalDiagnosticsFixture, FakeInternalDiagnosticsFixture>()));

} // namespace contract
