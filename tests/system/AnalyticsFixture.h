#pragma once

#include "tests/kstd/Analytics/SQLite/OtherConnection.h"
#include "tests/system/SystemFixture.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace system_tests {

using kstd::OtherConnection;
using Lines = std::vector<std::string>;

/// Where the daemon uploads to; an empty text leaves a setting out.
struct UploadSettings {
    std::string uploadURL = {};
    std::string bagURL = {};
    bool allowInsecureCertificate = false;
};

/// The daemon with its analytics: events that it is given, the database that it keeps them in, and
/// what it says about both.
class AnalyticsFixture : public SystemFixture {
  protected:
    using SystemFixture::SystemFixture;

    /// Starts a daemon in the place of the last one.
    void launch(const std::vector<std::string>& options = {});

    /// Writes the configuration for the next daemon, with the topic "kst".
    void configure(const UploadSettings& settings);

    /// Publishes figures that become an event, waits until they are acknowledged, and gives the
    /// lines of the analytics that came before the acknowledgement.
    Lines publishEvent();
    /// The same for an event of the other name, "policy".
    Lines publishPolicyEvent();

    /// The next event finds the upload date passed.
    void makeUploadDue();
    /// The upload date, in seconds since 1970.
    [[nodiscard]] std::int64_t uploadDate() const;
    [[nodiscard]] int storedEvents() const;

    /// Lines with what libraries say about a broken connection left out.
    [[nodiscard]] static Lines withoutReasons(Lines lines);

    [[nodiscard]] std::string database() const { return real(kDatabaseFile); }

    std::unique_ptr<Program> daemon;

  private:
    Lines publish(const std::string& record, const std::string& property);

    std::size_t taken_ = 0;
    int acknowledgements_ = 0;
};

} // namespace system_tests
