#pragma once

#include "base/NotCopied.h"
#include "platform/ConfigurationResource.h"
#include "platform/InternalDiagnostics.h"
#include "platform/SystemVersion.h"
#include "platform/UserDefaults.h"
#include "tests/platform/contract/ContractTest.h"

#include <optional>
#include <string>

/// What a machine tells about itself and what its administrator has set: four small interfaces.
namespace contract {

/// User defaults, nothing set at first.
struct UserDefaultsFixture : private base::NotCopied {
    virtual ~UserDefaultsFixture() = default;

    virtual platform::UserDefaults& defaults() = 0;

    /// Puts this in the place of everything that is set in the domain.
    virtual void put(const std::string& domain, const platform::ValueMap& content) = 0;
};

using UserDefaultsContract = ContractTest<UserDefaultsFixture>;

/// Configuration resources, none at first.
struct ConfigurationResourceFixture : private base::NotCopied {
    virtual ~ConfigurationResourceFixture() = default;

    virtual platform::ConfigurationResource& resources() = 0;

    /// Puts a resource in the place of what is there; none takes it away.
    virtual void put(const std::string& component, const std::string& name,
                     const std::optional<platform::ValueMap>& content) = 0;
};

using ConfigurationResourceContract = ContractTest<ConfigurationResourceFixture>;

/// A system of which nothing is known at first.
struct SystemVersionFixture : private base::NotCopied {
    virtual ~SystemVersionFixture() = default;

    virtual platform::SystemVersion& version() = 0;

    virtual void put(const std::optional<std::string>& build,
                     const std::optional<std::string>& product) = 0;
};

using SystemVersionContract = ContractTest<SystemVersionFixture>;

/// Internal diagnostics, all off at first.
struct InternalDiagnosticsFixture : private base::NotCopied {
    virtual ~InternalDiagnosticsFixture() = default;

    virtual platform::InternalDiagnostics& diagnostics() = 0;

    virtual void put(const std::string& subsystem, bool enabled) = 0;
};

using InternalDiagnosticsContract = ContractTest<InternalDiagnosticsFixture>;

} // namespace contract
