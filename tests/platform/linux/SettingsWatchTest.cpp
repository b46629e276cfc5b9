#include "platform/linux/SettingsWatch.h"

#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/RealTime.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>
#include <optional>

namespace platform {
namespace {

using testing::ElementsAre;

class SettingsWatchTest : public testing::Test {
  protected:
    void watch() {
        watch_.emplace(file("kstd/settings.conf"), loop, log, [this] { ++changes; });
    }

    [[nodiscard]] std::string file(const std::string& name) const {
        return directory.file("etc/" + name);
    }

    static void write(const std::string& path, const std::string& text) {
        std::ofstream(path) << text;
    }

    /// Handles everything that has been reported so far.
    void handleAll() {
        for (int i = 0; i < 20; ++i) {
            EXPECT_TRUE(loop.runOnce({0}));
        }
    }

    support::TemporaryDirectory directory;
    FakeSystemLog log;
    LinuxRunLoop loop{log};
    int changes = 0;

  private:
    std::optional<SettingsWatch> watch_;
};

TEST_F(SettingsWatchTest, ReplacingTheFileIsOneChange) {
    std::filesystem::create_directories(file("kstd"));
    write(file("kstd/settings.conf"), "old");
    watch();
    write(file("kstd/new"), "new");
    handleAll();
    EXPECT_EQ(changes, 0);
    std::filesystem::rename(file("kstd/new"), file("kstd/settings.conf"));
    handleAll();
    EXPECT_EQ(changes, 1);
}

TEST_F(SettingsWatchTest, WritingInPlaceIsToldWhenTheFileIsClosed) {
    std::filesystem::create_directories(file("kstd"));
    watch();
    std::ofstream open(file("kstd/settings.conf"));
    open << "half" << std::flush;
    handleAll();
    EXPECT_EQ(changes, 0);
    open.close();
    handleAll();
    EXPECT_EQ(changes, 1);
}

TEST_F(SettingsWatchTest, RemovingAndChangingTheModeAreChanges) {
    std::filesystem::create_directories(file("kstd"));
    write(file("kstd/settings.conf"), "x");
    watch();
    std::filesystem::permissions(file("kstd/settings.conf"), std::filesystem::perms::owner_read);
    handleAll();
    EXPECT_EQ(changes, 1);
    std::filesystem::remove(file("kstd/settings.conf"));
    handleAll();
    EXPECT_EQ(changes, 2);
}

TEST_F(SettingsWatchTest, DirectoryMayBeMadeLater) {
    std::filesystem::create_directories(directory.file("etc"));
    watch();
    EXPECT_THAT(log.texts(), ElementsAre());
    std::filesystem::create_directories(file("kstd"));
    handleAll();
    const int atDirectory = changes;
    write(file("kstd/settings.conf"), "x");
    handleAll();
    EXPECT_EQ(changes, atDirectory + 1);
}

TEST_F(SettingsWatchTest, DirectoryMayBeRemovedAndMadeAnew) {
    std::filesystem::create_directories(file("kstd"));
    watch();
    std::filesystem::remove_all(file("kstd"));
    handleAll();
    std::filesystem::create_directories(file("kstd"));
    handleAll();
    const int before = changes;
    write(file("kstd/settings.conf"), "x");
    handleAll();
    EXPECT_EQ(changes, before + 1);
}

TEST_F(SettingsWatchTest, OtherFilesDoNotMatter) {
    std::filesystem::create_directories(file("kstd"));
    watch();
    write(file("kstd/settings.conf~"), "x");
    write(file("kstd/other"), "x");
    write(file("settings.conf"), "x");
    handleAll();
    EXPECT_EQ(changes, 0);
}

TEST_F(SettingsWatchTest, NothingToWatchIsSaidAndIsNoSource) {
    watch();
    EXPECT_THAT(log.texts(), ElementsAre("kstd: SettingsWatch: cannot watch " + file("kstd") +
                                         ", error 2; changes are seen at the next start."));
    EXPECT_FALSE(loop.runOnce({0}));
}

} // namespace
} // namespace platform
