#include "base/FileDescriptor.h"
#include "kstctl/CommandLine.h"
#include "kstctl/Output.h"
#include "tests/kstd/Analytics/SQLite/OtherConnection.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <utility>

namespace kstctl {
namespace {

using namespace std::chrono_literals;

class ProgressTest : public testing::Test {
  protected:
    /// Time passes only as a test says: `step` at each look.
    Progress::Now clock() {
        return [this] {
            return std::exchange(now_, now_ + step);
        };
    }

    [[nodiscard]] std::string shown() const {
        std::ifstream file(path, std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("shown");
    base::FileDescriptor terminal{::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)};
    std::chrono::milliseconds step{0};

  private:
    std::chrono::steady_clock::time_point now_{};
};

TEST_F(ProgressTest, NothingBeforeTheFirstSecondIsOver) {
    Progress progress(terminal.get(), clock());
    progress.begin("working", 4);
    step = 1000ms;
    progress.advance(); // At 0.
    step = 1ms;
    progress.advance(); // At 1000.
    EXPECT_EQ(shown(), "");
    progress.advance(); // At 1001.
    EXPECT_EQ(shown(), "\rkstctl: working: 75 %");
    step = 100ms;
    progress.advance(); // At 1002.
    step = 0ms;
    progress.advance(); // At 1102.
    EXPECT_EQ(shown(), "\rkstctl: working: 75 %\rkstctl: working: 100 %");
    progress.end();
    EXPECT_TRUE(shown().ends_with("\rkstctl: working: 100 %\r" + std::string(22, ' ') + "\r"));
}

TEST_F(ProgressTest, ShorterWordsCoverLongerOnes) {
    Progress progress(terminal.get(), clock());
    step = 2000ms;
    progress.begin("something long", 1000);
    progress.advance();
    progress.advance();
    progress.begin("short", 0);
    progress.advance();
    EXPECT_EQ(shown(), "\rkstctl: something long: 0 %\rkstctl: short: 100 %       ");
}

TEST_F(ProgressTest, NothingWhereThereIsNoTerminal) {
    step = 2000ms;
    Progress progress(-1, clock());
    progress.begin("working", 1);
    progress.advance();
    progress.advance();
    progress.end();
    EXPECT_EQ(shown(), "");
}

/// Every command that goes through the events.
TEST_F(ProgressTest, LongWorkIsShown) {
    const auto root = directory.path() / "root";
    std::filesystem::create_directories(root / "var/root");
    {
        kstd::OtherConnection made(root / "var/root/.usbrestrictedmode_analytics_v2.db");
        made.run("create table Properties (key text primary key, value text)");
        made.run("create table all_events (id INTEGER PRIMARY KEY, timestamp REAL, data BLOB)");
        made.run("insert into all_events (data) values (null), (null), (null), (null)");
    }
    const base::FileDescriptor results(
        ::open(directory.file("results").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    step = 2000ms;
    const auto saidBy = [&](const auto& command, bool isJSON) {
        EXPECT_EQ(::ftruncate(terminal.get(), 0), 0);
        EXPECT_EQ(::lseek(terminal.get(), 0, SEEK_SET), 0);
        Output output(isJSON, results.get());
        Progress progress(terminal.get(), clock());
        EXPECT_EQ(run(command, Environment{platform::Paths(root.string()), output, progress, 1ms}),
                  ExitStatus::success);
        EXPECT_TRUE(shown().ends_with(" \r"));
        return shown();
    };
    const auto contains = [](const std::string& said, const std::string& text) {
        EXPECT_NE(said.find("\rkstctl: " + text), std::string::npos) << said;
    };
    for (const bool isJSON : {false, true}) {
        for (const std::string& said :
             {saidBy(EventsListCommand(), isJSON), saidBy(EventsExportCommand(), isJSON),
              saidBy(UploadCommand{.isDryRun = true, .postTime = {}}, isJSON)}) {
            contains(said, "reading events: 50 %");
            contains(said, "reading events: 100 %");
            contains(said, "writing events: 50 %");
        }
    }
    contains(saidBy(EventsListCommand(), false), "measuring events: 75 %");
    contains(saidBy(EventsExportCommand(), false), "looking for attributes: 75 %");
    contains(saidBy(EventsListCommand{.limit = 1, .type = "x"}, true), "looking for events: 75 %");
}

} // namespace
} // namespace kstctl
