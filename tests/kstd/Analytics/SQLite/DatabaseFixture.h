#pragma once

#include "kstd/Analytics/SQLite/KSTDSQLite.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeFormats.h"
#include "platform/fake/FakeSystemLog.h"
#include "tests/kstd/Analytics/SQLite/OtherConnection.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace kstd {

using Texts = std::vector<std::string>;

/// A place for database files and everything a database wants of the system.
class DatabaseFixture : public testing::Test {
  protected:
    static constexpr char kSchema[] = "create table T (a, b);\n";

    [[nodiscard]] std::unique_ptr<KSTDSQLite> database(const std::string& schema = kSchema) {
        return std::make_unique<KSTDSQLite>(path, schema, environment);
    }

    [[nodiscard]] std::unique_ptr<KSTDSQLite> openDatabase(const std::string& schema = kSchema) {
        auto made = database(schema);
        EXPECT_TRUE(made->openWithError(nullptr));
        return made;
    }

    /// The lines since the last call.
    [[nodiscard]] Texts lines() {
        Texts texts = log.texts();
        log.clear();
        return texts;
    }

    void setSecondsSince2001(std::int64_t seconds) {
        clock.set({(seconds + platform::kSecondsFrom1970To2001) * platform::kNanosecondsPerSecond});
    }

    static void write(const std::string& file, const std::string& content) {
        std::ofstream(file, std::ios::binary) << content;
    }

    [[nodiscard]] static std::string read(const std::string& file) {
        std::ifstream stream(file, std::ios::binary);
        return {std::istreambuf_iterator<char>(stream), {}};
    }

    [[nodiscard]] static unsigned modeOf(const std::string& file) {
        struct stat status {};
        EXPECT_EQ(::stat(file.c_str(), &status), 0) << file;
        return status.st_mode & 07777U;
    }

    support::TemporaryDirectory directory;
    const std::string path = directory.file("x.db");
    platform::FakeSystemLog log;
    platform::FakeClock clock;
    platform::FakePropertyLists propertyLists;
    DatabaseEnvironment environment{log, clock, propertyLists, std::chrono::milliseconds(1)};
};

} // namespace kstd
