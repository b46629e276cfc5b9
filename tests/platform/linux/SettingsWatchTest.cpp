#include "platform/linux/SettingsWatch.h"

#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxClock.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>
#include <optional>
#include <utility>

namespace platform {
namespace {

using testing::ElementsAre;
namespace fs = std::filesystem;

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

    /// Whether something was told since the last question.
    [[nodiscard]] bool hasChanged() {
        handleAll();
        return std::exchange(changes, 0) > 0;
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

TEST_F(SettingsWatchTest, RenamedDirectoryIsAChangeBothWays) {
    fs::create_directories(file("kstd"));
    write(file("kstd/settings.conf"), "x");
    watch();
    fs::rename(file("kstd"), file("elsewhere"));
    EXPECT_TRUE(hasChanged());
    write(file("elsewhere/settings.conf"), "y");
    EXPECT_FALSE(hasChanged()) << "what went away does not matter any more";
    fs::rename(file("elsewhere"), file("kstd"));
    EXPECT_TRUE(hasChanged());
    write(file("kstd/settings.conf"), "z");
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, DirectoryThatIsReplacedIsWatchedInItsNewForm) {
    fs::create_directories(file("kstd"));
    fs::create_directories(file("new"));
    watch();
    fs::rename(file("kstd"), file("old"));
    fs::rename(file("new"), file("kstd"));
    EXPECT_TRUE(hasChanged());
    write(file("old/settings.conf"), "x");
    EXPECT_FALSE(hasChanged());
    write(file("kstd/settings.conf"), "x");
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, ModeOfTheDirectoryIsAChange) {
    fs::create_directories(file("kstd"));
    watch();
    fs::permissions(file("kstd"), fs::perms::owner_all);
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, LinkedFileIsFollowedToItsTarget) {
    fs::create_directories(file("kstd"));
    fs::create_directories(directory.file("policies"));
    const std::string target = directory.file("policies/current.conf");
    write(target, "x");
    fs::create_symlink(target, file("kstd/settings.conf"));
    watch();
    write(target, "y");
    EXPECT_TRUE(hasChanged());
    write(directory.file("policies/new"), "z");
    EXPECT_FALSE(hasChanged());
    fs::rename(directory.file("policies/new"), target);
    EXPECT_TRUE(hasChanged());
    fs::remove(target);
    EXPECT_TRUE(hasChanged());
    write(target, "back");
    EXPECT_TRUE(hasChanged());
    fs::rename(directory.file("policies"), directory.file("others"));
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, EveryLinkOfAChainIsFollowedAndMayBeReplaced) {
    fs::create_directories(file("kstd"));
    for (const char* const version : {"v1", "v2"}) {
        fs::create_directories(file(std::string("versions/") + version));
        write(file(std::string("versions/") + version + "/s.conf"), version);
    }
    fs::create_symlink("v1", file("versions/current"));
    fs::create_symlink("../versions/current/s.conf", file("kstd/settings.conf"));
    watch();
    fs::create_symlink("v2", file("versions/next"));
    EXPECT_FALSE(hasChanged());
    fs::rename(file("versions/next"), file("versions/current"));
    EXPECT_TRUE(hasChanged());
    write(file("versions/v1/s.conf"), "old");
    EXPECT_FALSE(hasChanged());
    write(file("versions/v2/s.conf"), "new");
    EXPECT_TRUE(hasChanged());
    fs::remove(file("kstd/settings.conf"));
    EXPECT_TRUE(hasChanged());
    write(file("versions/v2/s.conf"), "nobody's");
    EXPECT_FALSE(hasChanged());
}

TEST_F(SettingsWatchTest, DirectoryMayBeALink) {
    fs::create_directories(directory.file("real"));
    fs::create_directories(directory.file("etc"));
    watch();
    fs::create_directory_symlink(directory.file("real"), file("kstd"));
    EXPECT_TRUE(hasChanged());
    write(directory.file("real/settings.conf"), "x");
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, LinkWithoutATargetIsWatchedUntilThereIsOne) {
    fs::create_directories(file("kstd"));
    watch();
    fs::create_symlink(directory.file("later/s.conf"), file("kstd/settings.conf"));
    EXPECT_TRUE(hasChanged());
    fs::create_directories(directory.file("later"));
    EXPECT_TRUE(hasChanged());
    write(directory.file("later/s.conf"), "x");
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, FurtherNameOfAFileIsAChange) {
    fs::create_directories(file("kstd"));
    write(file("kstd/other"), "x");
    watch();
    fs::create_hard_link(file("kstd/other"), file("kstd/settings.conf"));
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, LinksInACircleEnd) {
    fs::create_directories(file("kstd"));
    fs::create_symlink("settings.conf", file("kstd/settings.conf"));
    watch();
    fs::remove(file("kstd/settings.conf"));
    EXPECT_TRUE(hasChanged());
}

TEST_F(SettingsWatchTest, NothingToWatchIsSaidAndIsNoSource) {
    watch();
    EXPECT_THAT(log.texts(),
                ElementsAre("kstd: SettingsWatch: cannot watch " + directory.file("etc") +
                            ": No such file or directory; changes are seen at the "
                            "next start."));
    EXPECT_FALSE(loop.runOnce({0}));
}

} // namespace
} // namespace platform
