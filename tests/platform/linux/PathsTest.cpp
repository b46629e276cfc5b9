#include "platform/linux/Paths.h"

#include <gtest/gtest.h>

namespace {

using platform::Paths;

TEST(PathsTest, SystemRootAddsNothing) {
    const Paths paths("/");
    EXPECT_TRUE(paths.isSystemRoot());
    EXPECT_EQ(paths.under("/var/root/x"), "/var/root/x");
    EXPECT_EQ(paths.under("/"), "/");
    EXPECT_EQ(paths.eventSocket(), "/run/kstd/events.sock");
    EXPECT_EQ(paths.kernelSocket(), "/run/keystrand/service.sock");
    EXPECT_EQ(paths.managedSettingsDirectory(), "/etc/kstd");
    EXPECT_EQ(paths.managedSettings(), "/etc/kstd/managed-settings.conf");
    EXPECT_EQ(paths.alarmDirectory(), "/var/lib/kstd/alarms");
    EXPECT_EQ(platform::Paths::kJournalSocket, "/run/systemd/journal/socket");
    EXPECT_EQ(paths.stateDirectory(), "/var/root");
    EXPECT_EQ(paths.osRelease(), "/etc/os-release");
    EXPECT_EQ(paths.vendorOsRelease(), "/usr/lib/os-release");
    EXPECT_EQ(paths.userDefaults("com.x"), "/etc/kstd/com.x.plist");
    EXPECT_EQ(paths.configurationResource("x", "Y"), "/usr/share/x/Y.plist");
    EXPECT_EQ(paths.internalDiagnostics("x"), "/etc/kstd/internal-diagnostics/x");
}

TEST(PathsTest, OtherRootStandsInFront) {
    const Paths paths("/tmp/private");
    EXPECT_FALSE(paths.isSystemRoot());
    EXPECT_EQ(paths.under("/var/root/x"), "/tmp/private/var/root/x");
    EXPECT_EQ(paths.eventSocket(), "/tmp/private/run/kstd/events.sock");
    EXPECT_EQ(paths.kernelSocket(), "/tmp/private/run/keystrand/service.sock");
    EXPECT_EQ(paths.managedSettings(), "/tmp/private/etc/kstd/managed-settings.conf");
    EXPECT_EQ(paths.alarmDirectory(), "/tmp/private/var/lib/kstd/alarms");
    EXPECT_EQ(paths.stateDirectory(), "/tmp/private/var/root");
}

TEST(PathsTest, SlashesAtTheSeamMakeNoDifference) {
    EXPECT_EQ(Paths("/tmp/private/").under("/x"), "/tmp/private/x");
    EXPECT_EQ(Paths("/tmp/private//").under("x"), "/tmp/private/x");
    EXPECT_EQ(Paths("//").under("//x"), "/x");
    EXPECT_TRUE(Paths("//").isSystemRoot());
}

} // namespace
