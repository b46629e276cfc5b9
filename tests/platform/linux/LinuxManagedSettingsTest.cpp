#include "platform/linux/LinuxManagedSettings.h"

#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using platform::LinuxManagedSettings;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr char kPath[] = "/etc/kstd/managed-settings.conf";
constexpr char kNo[] = "restricted-mode-allowed = no\n";

class LinuxManagedSettingsTest : public testing::Test {
  protected:
    LinuxManagedSettingsTest() { root_.makeDirectory("/etc/kstd"); }

    bool allowed() { return settings_.isRestrictedModeAllowed(); }

    std::string line(const std::string& reason) {
        return "kstd: ManagedSettings: " + root_.real(kPath) + ": " + reason;
    }

    /// The setting allows, and the log says why, once for each question.
    void expectDoubt(const std::string& reason) {
        const std::size_t before = support::countOpenDescriptors();
        log_.clear();
        EXPECT_TRUE(allowed());
        ASSERT_THAT(log_.texts(), ElementsAre(line(reason + "; restricted mode stays allowed.")));
        EXPECT_EQ(log_.lines().front().level, platform::LogLevel::warning);
        EXPECT_TRUE(allowed());
        EXPECT_EQ(log_.texts().size(), 2U);
        EXPECT_EQ(support::countOpenDescriptors(), before);
    }

    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    LinuxManagedSettings settings_{root_.paths(), log_};
};

TEST_F(LinuxManagedSettingsTest, MissingFileAllowsSilently) {
    EXPECT_TRUE(allowed());
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, MissingDirectoryAllowsSilently) {
    std::filesystem::remove_all(root_.real("/etc"));
    EXPECT_TRUE(allowed());
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, FileWithoutTheSettingAllowsSilently) {
    root_.put(kPath, "# nothing yet\n");
    EXPECT_TRUE(allowed());
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, NoForbidsSilently) {
    for (const unsigned mode : {0400U, 0600U, 0644U, 0755U}) {
        root_.put(kPath, kNo, mode);
        EXPECT_FALSE(allowed()) << mode;
        root_.setMode(kPath, 0600);
    }
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, FileReplacedWholeIsReadAnew) {
    root_.put(kPath, kNo);
    EXPECT_FALSE(allowed());
    root_.put("/etc/kstd/new", "restricted-mode-allowed = yes\n");
    std::filesystem::rename(root_.real("/etc/kstd/new"), root_.real(kPath));
    EXPECT_TRUE(allowed());
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, UnknownKeyIsSaidAndTheRestCounts) {
    root_.put(kPath, "colour = blue\nrestricted-mode-allowed = no\n");
    EXPECT_FALSE(allowed());
    EXPECT_THAT(log_.texts(), ElementsAre(line("line 1: unknown key colour; ignored.")));
    EXPECT_EQ(log_.lines().front().level, platform::LogLevel::warning);
}

TEST_F(LinuxManagedSettingsTest, MalformedLineIsDoubt) {
    root_.put(kPath, std::string(kNo) + "garbage\n");
    expectDoubt("line 2: is not of the form \"key = value\"");
}

TEST_F(LinuxManagedSettingsTest, BadValueIsDoubt) {
    root_.put(kPath, "restricted-mode-allowed = No\n");
    expectDoubt("line 1: the value of restricted-mode-allowed is neither yes nor no");
}

TEST_F(LinuxManagedSettingsTest, SettingGivenTwiceIsDoubt) {
    root_.put(kPath, std::string(kNo) + kNo);
    expectDoubt("line 2: gives restricted-mode-allowed a second time");
}

TEST_F(LinuxManagedSettingsTest, WritableByOthersIsDoubt) {
    for (const unsigned mode : {0620U, 0602U, 0666U}) {
        root_.put(kPath, kNo, mode);
        expectDoubt("writable by group or others");
    }
}

TEST_F(LinuxManagedSettingsTest, OwnerOtherThanRootOrTheProcessIsDoubt) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can give a file away";
    }
    root_.put(kPath, kNo, 0644);
    ASSERT_EQ(::chown(root_.real(kPath).c_str(), 12345, 12345), 0);
    expectDoubt("owned by user 12345, neither root nor the daemon's own");
}

TEST_F(LinuxManagedSettingsTest, FileOfTheProcesssOwnUserCounts) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can become another user";
    }
    root_.put(kPath, kNo, 0644);
    ASSERT_EQ(::chown(root_.real(kPath).c_str(), 12345, 12345), 0);
    for (const char* const directory : {"/", "/etc", "/etc/kstd"}) {
        root_.setMode(directory, 0711);
    }
    ASSERT_EQ(::seteuid(12345), 0);
    const bool isAllowed = allowed();
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_FALSE(isAllowed);
    EXPECT_THAT(log_.texts(), IsEmpty());
}

TEST_F(LinuxManagedSettingsTest, LinkIsJudgedByTheFileBehindIt) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can give a link away";
    }
    root_.put("/etc/kstd/behind", kNo, 0644);
    std::filesystem::create_symlink("behind", root_.real(kPath));
    ASSERT_EQ(::lchown(root_.real(kPath).c_str(), 12345, 12345), 0);
    EXPECT_FALSE(allowed());
    ASSERT_EQ(::chown(root_.real("/etc/kstd/behind").c_str(), 12345, 12345), 0);
    expectDoubt("owned by user 12345, neither root nor the daemon's own");
}

TEST_F(LinuxManagedSettingsTest, LargestFileCountsAndALargerOneIsDoubt) {
    const std::string setting = kNo;
    for (const std::size_t size :
         {LinuxManagedSettings::kMaxSize - 1, LinuxManagedSettings::kMaxSize}) {
        root_.put(kPath, setting + "#" + std::string(size - setting.size() - 1, 'x'));
        EXPECT_FALSE(allowed()) << size;
    }
    EXPECT_THAT(log_.texts(), IsEmpty());
    root_.put(kPath,
              setting + "#" + std::string(LinuxManagedSettings::kMaxSize - setting.size(), 'x'));
    expectDoubt("larger than 65536 bytes");
}

TEST_F(LinuxManagedSettingsTest, DirectoryIsDoubt) {
    root_.makeDirectory(kPath);
    expectDoubt("not a regular file");
}

TEST_F(LinuxManagedSettingsTest, PipeIsDoubtWithoutWaiting) {
    ASSERT_EQ(::mkfifo(root_.real(kPath).c_str(), 0600), 0);
    expectDoubt("not a regular file");
}

TEST_F(LinuxManagedSettingsTest, UnreadableFileIsDoubt) {
    // Opening a link that leads back to itself fails for everybody, root included.
    std::filesystem::create_symlink("managed-settings.conf", root_.real(kPath));
    expectDoubt("cannot be read: Too many levels of symbolic links");
}

TEST_F(LinuxManagedSettingsTest, FileInThePlaceOfTheDirectoryIsDoubt) {
    std::filesystem::remove_all(root_.real("/etc/kstd"));
    root_.put("/etc/kstd", "");
    expectDoubt("cannot be read: Not a directory");
}

} // namespace
