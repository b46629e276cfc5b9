#include "keystrand-linux/GateConfiguration.h"

#include "base/Concat.h"
#include "tests/support/FailingCalls.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace keystrand::usb {
namespace {

namespace fs = std::filesystem;
using Remarks = std::vector<std::string>;

GateConfiguration parse(std::string_view text) {
    return parseGateConfiguration(text, "FILE");
}

/// The only line that the text leads to.
std::string remarkOf(std::string_view text) {
    const Remarks remarks = parse(text).remarks;
    EXPECT_EQ(remarks.size(), 1U) << text;
    return remarks.empty() ? "" : remarks[0];
}

void expectUnset(const Keystrand::Settings& settings) {
    EXPECT_EQ(settings.period, 3600U);
    EXPECT_TRUE(settings.rules.internal);
    EXPECT_EQ(settings.rules.keyboards, KeyboardRule::whenNone);
    EXPECT_EQ(settings.rules.onUnlock, OnUnlock::accept);
    EXPECT_TRUE(settings.rules.notKeyboards.empty());
}

TEST(GateConfigurationTest, NothingIsSet) {
    for (const char* text : {"", "\n\n", "# period = 5\n", "  \t\r\n#\n"}) {
        const GateConfiguration configuration = parse(text);
        expectUnset(configuration.settings);
        EXPECT_EQ(configuration.remarks, Remarks()) << text;
    }
}

/// What whoever starts from the example gets until they change something.
TEST(GateConfigurationTest, ExampleSaysWhatHoldsWithoutIt) {
    std::ifstream file(SOURCE_ROOT "/examples/keystrand.conf");
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    const GateConfiguration configuration = parse(text);
    expectUnset(configuration.settings);
    EXPECT_EQ(configuration.remarks, Remarks());
    for (const char* key : {"\nperiod = ", "\ninternal = ", "\nkeyboards = ", "\n#not-keyboards = ",
                            "\non-unlock = "}) {
        EXPECT_NE(text.find(key), std::string::npos) << key;
    }
}

TEST(GateConfigurationTest, EachKeyIsTaken) {
    const GateConfiguration configuration = parse("# all of them\n"
                                                  "period = 60\n"
                                                  "internal=no\r\n"
                                                  "  keyboards  =  always  \n"
                                                  "not-keyboards = 046d:C31C, 1234:5678\n"
                                                  "not-keyboards = ffff:0000\n"
                                                  "on-unlock = replug");
    EXPECT_EQ(configuration.remarks, Remarks());
    EXPECT_EQ(configuration.settings.period, 60U);
    EXPECT_FALSE(configuration.settings.rules.internal);
    EXPECT_EQ(configuration.settings.rules.keyboards, KeyboardRule::always);
    EXPECT_EQ(configuration.settings.rules.onUnlock, OnUnlock::replug);
    EXPECT_EQ(
        configuration.settings.rules.notKeyboards,
        (std::vector<GateRules::Product>{{0x046D, 0xC31C}, {0x1234, 0x5678}, {0xFFFF, 0x0000}}));
}

TEST(GateConfigurationTest, EachWordOfEachKey) {
    EXPECT_TRUE(parse("internal = yes").settings.rules.internal);
    EXPECT_EQ(parse("keyboards = never").settings.rules.keyboards, KeyboardRule::never);
    EXPECT_EQ(parse("keyboards = when-none").settings.rules.keyboards, KeyboardRule::whenNone);
    EXPECT_EQ(parse("on-unlock = accept").settings.rules.onUnlock, OnUnlock::accept);
}

TEST(GateConfigurationTest, PeriodsAtTheLimits) {
    EXPECT_EQ(parse("period = 0").settings.period, 0U);
    EXPECT_EQ(parse("period = 4294967295").settings.period, 4294967295U);
    for (const char* word : {"4294967296", "-1", "1h", "", "0x10", "1 0", "+1"}) {
        const std::string text = base::concat("period = ", word);
        EXPECT_EQ(parse(text).settings.period, 3600U) << word;
        EXPECT_EQ(remarkOf(text), base::concat("keystrand: FILE: line 1: \"", word,
                                               "\" is no value of period; what it is without being "
                                               "set holds."));
    }
}

TEST(GateConfigurationTest, WordsThatAreNotUnderstoodChangeNothing) {
    const GateConfiguration configuration =
        parse("internal = No\n\nkeyboards = sometimes\non-unlock =\n"
              "period 5\ncolour = red\nnot-keyboards = 046d 046d:c31c 046g:c31c 046d-c31c\n");
    Keystrand::Settings settings = configuration.settings;
    EXPECT_EQ(settings.rules.notKeyboards, (std::vector<GateRules::Product>{{0x046D, 0xC31C}}));
    settings.rules.notKeyboards.clear();
    expectUnset(settings);
    EXPECT_EQ(
        configuration.remarks,
        (Remarks{
            "keystrand: FILE: line 1: \"No\" is no value of internal; what it is without being set "
            "holds.",
            "keystrand: FILE: line 3: \"sometimes\" is no value of keyboards; what it is without "
            "being set holds.",
            "keystrand: FILE: line 4: \"\" is no value of on-unlock; what it is without being set "
            "holds.",
            "keystrand: FILE: line 5: \"period 5\" is not of the form \"key = value\"; ignored.",
            "keystrand: FILE: line 6: unknown key \"colour\"; ignored.",
            "keystrand: FILE: line 7: \"046d\" in not-keyboards is no ID like 046d:c31c; ignored.",
            "keystrand: FILE: line 7: \"046g:c31c\" in not-keyboards is no ID like 046d:c31c; "
            "ignored.",
            "keystrand: FILE: line 7: \"046d-c31c\" in not-keyboards is no ID like 046d:c31c; "
            "ignored."}));
}

TEST(GateConfigurationTest, KeyThatIsGivenTwiceIsNotSet) {
    EXPECT_EQ(parse("period = 5\nperiod = 7\n").settings.period, 3600U);
    EXPECT_EQ(parse("period = 5\nperiod = 7\nperiod = 5\n").settings.period, 3600U);
    EXPECT_EQ(remarkOf("period = 5\nperiod = 7\n"),
              "keystrand: FILE: line 2: period is given again, as \"7\"; what it is without being "
              "set holds.");
}

TEST(GateConfigurationTest, LinesForTheLogStaySmallAndPlain) {
    EXPECT_EQ(remarkOf("\x1B[1m\"\\\x7F~ = 1"),
              "keystrand: FILE: line 1: unknown key \"?[1m???~\"; ignored.");
    const std::string longest(64, 'k');
    EXPECT_EQ(remarkOf(longest + "=1"),
              base::concat("keystrand: FILE: line 1: unknown key \"", longest, "\"; ignored."));
    EXPECT_EQ(remarkOf(longest + "k=1"),
              base::concat("keystrand: FILE: line 1: unknown key \"", longest, "...\"; ignored."));
    std::string text;
    for (int line = 0; line < 16; ++line) {
        text += "x = 1\n";
    }
    EXPECT_EQ(parse(text).remarks.size(), 16U);
    const Remarks remarks = parse(text + "x = 1\nx = 1\n").remarks;
    ASSERT_EQ(remarks.size(), 17U);
    EXPECT_EQ(remarks[16], "keystrand: FILE: 2 more that is not understood.");
}

class GateConfigurationFileTest : public testing::Test {
  protected:
    GateConfigurationFileTest() {
        fs::create_directories(path_.parent_path());
        fs::create_directories(chassis_.parent_path());
    }

    void write(std::string_view text) const { std::ofstream(path_) << text; }
    [[nodiscard]] GateConfiguration read() const {
        return readGateConfiguration(directory_.path().string());
    }
    void expectDistrusted(const std::string& reason) const {
        const GateConfiguration configuration = read();
        expectUnset(configuration.settings);
        EXPECT_EQ(configuration.remarks, Remarks{base::concat("keystrand: ", path_.string(), ": ",
                                                              reason, "; nothing of it holds.")});
    }

    const support::TemporaryDirectory directory_;
    const fs::path path_ = directory_.path() / "etc/keystrand/keystrand.conf";
    const fs::path chassis_ = directory_.path() / "sys/class/dmi/id/chassis_type";
};

TEST_F(GateConfigurationFileTest, NoFileSetsNothing) {
    expectUnset(read().settings);
    EXPECT_EQ(read().remarks, Remarks());
}

TEST_F(GateConfigurationFileTest, FileIsRead) {
    write("period = 5\nx\n");
    EXPECT_EQ(read().settings.period, 5U);
    EXPECT_EQ(read().remarks, Remarks{base::concat("keystrand: ", path_.string(),
                                                   ": line 2: \"x\" is not of the form \"key = "
                                                   "value\"; ignored.")});
}

TEST_F(GateConfigurationFileTest, FileThatOthersMayWriteCountsForNothing) {
    write("period = 5\n");
    for (const auto writer : {fs::perms::group_write, fs::perms::others_write}) {
        fs::permissions(path_, fs::perms::owner_read | fs::perms::owner_write | writer);
        expectDistrusted("writable by group or others");
    }
    fs::permissions(path_, fs::perms::owner_read | fs::perms::owner_write);
    EXPECT_EQ(read().settings.period, 5U);
    constexpr uid_t kSomebody = 4711;
    if (::chown(path_.c_str(), kSomebody, static_cast<gid_t>(-1)) != 0) {
        GTEST_SKIP() << "a file cannot be given away here";
    }
    expectDistrusted("owned by user 4711, neither root nor the service's own");
}

TEST_F(GateConfigurationFileTest, FileOfTheServicesOwnUserIsRead) {
    write("period = 5\n");
    constexpr uid_t kSomebody = 4711;
    for (fs::path open = path_.parent_path(); open != directory_.path().parent_path();
         open = open.parent_path()) {
        fs::permissions(open, fs::perms::group_exec | fs::perms::others_exec,
                        fs::perm_options::add);
    }
    fs::permissions(path_, fs::perms::owner_read);
    if (::chown(path_.c_str(), kSomebody, static_cast<gid_t>(-1)) != 0) {
        GTEST_SKIP() << "a file cannot be given away here";
    }
    ASSERT_EQ(::seteuid(kSomebody), 0);
    const GateConfiguration configuration = read();
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_EQ(configuration.remarks, Remarks());
    EXPECT_EQ(configuration.settings.period, 5U);
}

TEST_F(GateConfigurationFileTest, ReadsThatFail) {
    write("period = 5\n");
    support::FailingCalls::read = {EINTR, EINTR};
    EXPECT_EQ(read().settings.period, 5U);
    support::FailingCalls::read = {EIO};
    expectDistrusted("cannot be read: Input/output error");
    support::FailingCalls::fstat = {EIO};
    expectDistrusted("cannot be read: Input/output error");
    EXPECT_TRUE(support::FailingCalls::read.empty());
    EXPECT_TRUE(support::FailingCalls::fstat.empty());
}

TEST_F(GateConfigurationFileTest, SizeHasALimit) {
    const std::string line = "period = 5\n";
    write(line + std::string(GateConfiguration::kMaxSize - line.size(), '\n'));
    EXPECT_EQ(read().settings.period, 5U);
    write(line + std::string(GateConfiguration::kMaxSize - line.size() + 1, '\n'));
    expectDistrusted("larger than 65536 bytes");
}

TEST_F(GateConfigurationFileTest, WhatIsNoFileCountsForNothing) {
    fs::create_directory(path_);
    expectDistrusted("not a regular file");
    fs::remove(path_);
    ASSERT_EQ(::mkfifo(path_.c_str(), 0600), 0);
    expectDistrusted("not a regular file");
    fs::remove(path_);
    fs::create_symlink(path_.filename(), path_);
    expectDistrusted("cannot be read: Too many levels of symbolic links");
}

TEST_F(GateConfigurationFileTest, PortableMachinesHaveAKeyboard) {
    std::vector<int> with;
    EXPECT_FALSE(read().settings.rules.keyboardBuiltIn);
    for (int type = 0; type < 40; ++type) {
        std::ofstream(chassis_) << type << '\n';
        if (read().settings.rules.keyboardBuiltIn) {
            with.push_back(type);
        }
    }
    EXPECT_EQ(with, (std::vector<int>{8, 9, 10, 11, 14, 30, 31, 32}));
    std::ofstream(chassis_) << "laptop\n";
    EXPECT_FALSE(read().settings.rules.keyboardBuiltIn);
}

} // namespace
} // namespace keystrand::usb
