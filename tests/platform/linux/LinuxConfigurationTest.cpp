// User defaults, configuration resources and internal diagnostics as files.

#include "platform/linux/LinuxConfiguration.h"

#include "platform/fake/FakeSystemLog.h"
#include "platform/formats/PropertyListCodec.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using platform::Value;
using platform::ValueMap;
using Texts = std::vector<std::string>;

constexpr char kDomain[] = "com.zerva.keystrand.analytics";
constexpr char kDefaults[] = "/etc/kstd/com.zerva.keystrand.analytics.plist";
constexpr char kResource[] = "/usr/share/keystrand/KSTDAnalyticsLogging.plist";
constexpr char kXML[] = "<plist><dict><key>topic</key><string>kst</string></dict></plist>";

class LinuxConfigurationTest : public testing::Test {
  protected:
    LinuxConfigurationTest() {
        root_.makeDirectory("/etc/kstd");
        root_.makeDirectory("/usr/share/keystrand");
    }

    std::optional<Value> topic() { return valueIn(kDomain, "topic"); }

    std::optional<Value> valueIn(std::string_view domain, std::string_view key) {
        const ValueMap map = defaults_.load(domain);
        const auto found = map.find(key);
        return found != map.end() ? std::optional(found->second) : std::nullopt;
    }

    std::optional<ValueMap> resource() {
        return resources_.load("Keystrand", "KSTDAnalyticsLogging");
    }

    /// Both readers ignore their file and say why, once for each call.
    void expectIgnored(const std::string& reason) {
        const std::size_t before = support::countOpenDescriptors();
        log_.clear();
        EXPECT_EQ(topic(), std::nullopt);
        EXPECT_EQ(resource(), std::nullopt);
        std::string ofDefaults = "kstd: UserDefaults: ";
        ofDefaults += root_.real(kDefaults) + ": " + reason + "; ignored.";
        std::string ofResource = "kstd: ConfigurationResource: ";
        ofResource += root_.real(kResource) + ": " + reason + "; ignored.";
        EXPECT_EQ(log_.texts(), (Texts{ofDefaults, ofResource}));
        for (const auto& line : log_.lines()) {
            EXPECT_EQ(line.level, platform::LogLevel::warning);
        }
        EXPECT_EQ(topic(), std::nullopt);
        EXPECT_EQ(log_.texts().size(), 3U);
        EXPECT_EQ(support::countOpenDescriptors(), before);
    }

    void putBoth(const std::string& text, unsigned mode = 0644) {
        root_.put(kDefaults, text, mode);
        root_.put(kResource, text, mode);
    }

    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::PropertyListCodec propertyLists_;
    platform::LinuxUserDefaults defaults_{root_.paths(), propertyLists_, log_};
    platform::LinuxConfigurationResource resources_{root_.paths(), propertyLists_, log_};
};

TEST_F(LinuxConfigurationTest, MissingFilesAndDirectoriesAreSilentlyNone) {
    EXPECT_EQ(topic(), std::nullopt);
    EXPECT_EQ(resource(), std::nullopt);
    std::filesystem::remove_all(root_.real("/etc"));
    std::filesystem::remove_all(root_.real("/usr"));
    EXPECT_EQ(topic(), std::nullopt);
    EXPECT_EQ(resource(), std::nullopt);
    EXPECT_EQ(log_.texts(), Texts());
}

TEST_F(LinuxConfigurationTest, XMLFilesOfUsualModesAreRead) {
    for (const unsigned mode : {0400U, 0600U, 0644U, 0755U}) {
        putBoth(kXML, mode);
        EXPECT_EQ(topic(), Value("kst")) << mode;
        EXPECT_EQ(resource(), (ValueMap{{"topic", "kst"}})) << mode;
        root_.setMode(kDefaults, 0600);
        root_.setMode(kResource, 0600);
    }
    EXPECT_EQ(log_.texts(), Texts());
}

TEST_F(LinuxConfigurationTest, WhatIsNoPropertyListIsIgnored) {
    for (const char* text : {"", "topic = kst\n", "bplist00", "<plist><dict>"}) {
        putBoth(text);
        expectIgnored("not a property list");
    }
}

TEST_F(LinuxConfigurationTest, WhatIsNoMapIsIgnored) {
    for (const char* text : {"<plist><true/></plist>", "<plist><array/></plist>"}) {
        putBoth(text);
        expectIgnored("not a map");
    }
}

TEST_F(LinuxConfigurationTest, WritableByOthersIsIgnored) {
    for (const unsigned mode : {0620U, 0602U, 0666U}) {
        putBoth(kXML, mode);
        expectIgnored("writable by group or others");
    }
}

TEST_F(LinuxConfigurationTest, OwnerOtherThanRootOrTheProcessIsIgnored) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "only root can give a file away";
    }
    putBoth(kXML);
    ASSERT_EQ(::chown(root_.real(kDefaults).c_str(), 12345, 12345), 0);
    ASSERT_EQ(::chown(root_.real(kResource).c_str(), 12345, 12345), 0);
    expectIgnored("owned by user 12345, neither root nor the daemon's own");
}

TEST_F(LinuxConfigurationTest, LargestFileIsReadAndALargerOneIsIgnored) {
    constexpr std::size_t kMost = platform::PropertyListFile::kMaxSize;
    const std::string start = kXML;
    putBoth(start + std::string(kMost - start.size(), '\n'));
    EXPECT_EQ(topic(), Value("kst"));
    EXPECT_EQ(resource(), (ValueMap{{"topic", "kst"}}));
    putBoth(start + std::string(kMost - start.size() + 1, '\n'));
    expectIgnored("larger than 1048576 bytes");
}

TEST_F(LinuxConfigurationTest, DirectoryIsIgnored) {
    root_.makeDirectory(kDefaults);
    root_.makeDirectory(kResource);
    expectIgnored("not a regular file");
}

TEST_F(LinuxConfigurationTest, UnreadableFileIsIgnored) {
    // Opening a link that leads back to itself fails for everybody, root included.
    for (const char* path : {kDefaults, kResource}) {
        const std::filesystem::path file = root_.real(path);
        std::filesystem::create_symlink(file.filename(), file);
    }
    expectIgnored("cannot be read: Too many levels of symbolic links");
}

TEST_F(LinuxConfigurationTest, NamesDoNotLeadOutOfTheDirectory) {
    root_.put("/etc/outside.plist", kXML);
    root_.makeDirectory("/etc/kstd/below");
    root_.put("/etc/kstd/below/x.plist", kXML);
    root_.put("/usr/share/x.plist", kXML);
    root_.put("/usr/x.plist", kXML);
    for (const std::string_view name :
         {std::string_view("../outside"), std::string_view("/etc/outside"),
          std::string_view("below/x"), std::string_view("./below/x"), std::string_view(".."),
          std::string_view("."), std::string_view(""), std::string_view("x\0y", 3)}) {
        EXPECT_EQ(valueIn(name, "topic"), std::nullopt) << name;
        EXPECT_EQ(resources_.load(name, "x"), std::nullopt) << name;
        EXPECT_EQ(resources_.load("keystrand", name), std::nullopt) << name;
    }
    EXPECT_EQ(resources_.load("keystrand", "../x"), std::nullopt);
    EXPECT_EQ(log_.texts(), Texts());
}

TEST_F(LinuxConfigurationTest, ComponentIsInLowerCaseAndNothingElseIs) {
    root_.put(kResource, kXML);
    for (const char* component : {"Keystrand", "KEYSTRAND", "keystrand"}) {
        EXPECT_TRUE(resources_.load(component, "KSTDAnalyticsLogging")) << component;
    }
    EXPECT_EQ(resources_.load("Keystrand", "kstdanalyticslogging"), std::nullopt);
}

TEST_F(LinuxConfigurationTest, DiagnosticsAreOnByARegularFile) {
    platform::LinuxInternalDiagnostics diagnostics(root_.paths());
    EXPECT_FALSE(diagnostics.isEnabled("analytics"));
    root_.makeDirectory("/etc/kstd/internal-diagnostics/directory");
    EXPECT_FALSE(diagnostics.isEnabled("analytics"));
    EXPECT_FALSE(diagnostics.isEnabled("directory"));
    root_.put("/etc/kstd/internal-diagnostics/analytics", "anything", 0000);
    EXPECT_TRUE(diagnostics.isEnabled("analytics"));
    root_.put("/etc/kstd/outside", "");
    EXPECT_FALSE(diagnostics.isEnabled("../outside"));
    EXPECT_FALSE(diagnostics.isEnabled(".."));
    EXPECT_FALSE(diagnostics.isEnabled(""));
}

} // namespace
