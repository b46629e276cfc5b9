#pragma once

#include "platform/ConfigurationResource.h"
#include "platform/InternalDiagnostics.h"
#include "platform/ManagedSettings.h"
#include "platform/SystemVersion.h"
#include "platform/UserDefaults.h"

#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

/// User defaults that a test sets, before anybody on another thread reads them.
class FakeUserDefaults final : public UserDefaults {
  public:
    FakeUserDefaults();
    ~FakeUserDefaults() override;

    [[nodiscard]] ValueMap load(std::string_view domain) override;
    void set(std::string_view domain, std::string_view key, Value value);
    void remove(std::string_view domain, std::string_view key);

  private:
    std::map<std::string, ValueMap, std::less<>> domains_;
};

/// Configuration resources that a test puts, before anybody on another thread loads them.
class FakeConfigurationResource final : public ConfigurationResource {
  public:
    FakeConfigurationResource();
    ~FakeConfigurationResource() override;

    [[nodiscard]] std::optional<ValueMap> load(std::string_view component,
                                               std::string_view name) override;
    void put(std::string_view component, std::string_view name, ValueMap content);
    void remove(std::string_view component, std::string_view name);

  private:
    /// By component and name.
    std::map<std::pair<std::string, std::string>, ValueMap> resources_;
};

/// Diagnostics that a test switches on; all are off at first.
class FakeInternalDiagnostics final : public InternalDiagnostics {
  public:
    [[nodiscard]] bool isEnabled(std::string_view subsystem) override {
        return enabled_.contains(subsystem);
    }

    void enable(std::string_view subsystem) { enabled_.emplace(subsystem); }

    void disable(std::string_view subsystem) { enabled_.erase(std::string(subsystem)); }

  private:
    std::set<std::string, std::less<>> enabled_;
};

/// A system whose version a test sets; nothing is known at first.
class FakeSystemVersion final : public SystemVersion {
  public:
    [[nodiscard]] std::optional<std::string> build() override { return build_; }
    [[nodiscard]] std::optional<std::string> product() override { return product_; }

    void setBuild(std::optional<std::string> build) { build_ = std::move(build); }
    void setProduct(std::optional<std::string> product) { product_ = std::move(product); }

  private:
    std::optional<std::string> build_;
    std::optional<std::string> product_;
};

/// Settings that a test puts. None put stands for a file that is missing or of no use.
class FakeManagedSettings final : public ManagedSettings {
  public:
    /// `announce` posts the event of a change.
    explicit FakeManagedSettings(std::function<void()> announce) : announce_(std::move(announce)) {}

    [[nodiscard]] bool isRestrictedModeAllowed() override {
        ++questions_;
        return allowed_.value_or(true);
    }

    /// Puts the setting and posts the event of a change.
    void change(std::optional<bool> allowed) {
        put(allowed);
        announce_();
    }

    /// Puts the setting as it stood before the process was started.
    void put(std::optional<bool> allowed) { allowed_ = allowed; }

    /// How often the setting was asked for.
    [[nodiscard]] std::size_t questions() const { return questions_; }

  private:
    std::function<void()> announce_;
    std::optional<bool> allowed_;
    std::size_t questions_ = 0;
};

} // namespace platform
