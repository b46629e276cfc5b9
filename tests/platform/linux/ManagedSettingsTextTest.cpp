#include "platform/linux/LinuxManagedSettings.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using platform::ManagedSettingsText;
using platform::parseManagedSettings;

void expectAllowed(std::string_view text, bool allowed) {
    const ManagedSettingsText settings = parseManagedSettings(text);
    EXPECT_EQ(settings.restrictedModeAllowed, allowed) << text;
    EXPECT_EQ(settings.problem, "") << text;
    EXPECT_EQ(settings.remark, "") << text;
}

void expectProblem(std::string_view text, const std::string& problem) {
    const ManagedSettingsText settings = parseManagedSettings(text);
    EXPECT_TRUE(settings.restrictedModeAllowed) << text;
    EXPECT_EQ(settings.problem, problem) << text;
    EXPECT_EQ(settings.remark, "") << text;
}

TEST(ManagedSettingsTextTest, FileWithoutTheSettingAllows) {
    expectAllowed("", true);
    expectAllowed("\n", true);
    expectAllowed("  \t \n\n# restricted-mode-allowed = no\n  # indented\n#", true);
}

TEST(ManagedSettingsTextTest, YesAndNo) {
    expectAllowed("restricted-mode-allowed = yes\n", true);
    expectAllowed("restricted-mode-allowed = no\n", false);
}

TEST(ManagedSettingsTextTest, BlanksAndTheLastNewlineMakeNoDifference) {
    expectAllowed("restricted-mode-allowed=no", false);
    expectAllowed("\t restricted-mode-allowed \t=\t no \t\n", false);
    expectAllowed("# first\n\nrestricted-mode-allowed = no\n\n# last", false);
}

TEST(ManagedSettingsTextTest, OtherValuesAreAProblem) {
    for (const char* value : {"No", "NO", "nO", "false", "0", "n", "noo", "\"no\"", "", "= no",
                              "no # comment", "no\r"}) {
        expectProblem(std::string("restricted-mode-allowed = ") + value + "\n",
                      "line 1: the value of restricted-mode-allowed is neither yes nor no");
    }
}

TEST(ManagedSettingsTextTest, ValueWithAZeroByteIsAProblem) {
    expectProblem(std::string_view("restricted-mode-allowed = no\0", 29),
                  "line 1: the value of restricted-mode-allowed is neither yes nor no");
}

TEST(ManagedSettingsTextTest, LinesOfAnotherFormAreAProblem) {
    for (const char* line :
         {"restricted-mode-allowed", "no", "= no", "=", "[section]", "Restricted-Mode-Allowed = no",
          "restricted mode allowed = no", "restricted_mode_allowed = no", "\xef\xbb\xbfkey = value",
          "\r", "a.b = no", "a:b = no", "a{b = no"}) {
        expectProblem(std::string("# comment\n") + line + "\nrestricted-mode-allowed = no\n",
                      "line 2: is not of the form \"key = value\"");
    }
}

TEST(ManagedSettingsTextTest, SettingGivenTwiceIsAProblem) {
    expectProblem("restricted-mode-allowed = no\n\nrestricted-mode-allowed = no\n",
                  "line 3: gives restricted-mode-allowed a second time");
    expectProblem("restricted-mode-allowed = no\nrestricted-mode-allowed = yes",
                  "line 2: gives restricted-mode-allowed a second time");
}

TEST(ManagedSettingsTextTest, ProblemBehindTheSettingCountsToo) {
    expectProblem("restricted-mode-allowed = no\ngarbage\n",
                  "line 2: is not of the form \"key = value\"");
}

TEST(ManagedSettingsTextTest, UnknownKeysAreRemarkedOnAndTheRestCounts) {
    ManagedSettingsText settings =
        parseManagedSettings("# comment\ncolour = \nrestricted-mode-allowed = no\n");
    EXPECT_FALSE(settings.restrictedModeAllowed);
    EXPECT_EQ(settings.problem, "");
    EXPECT_EQ(settings.remark, "line 2: unknown key colour");

    settings = parseManagedSettings("0-9az = 1\n");
    EXPECT_EQ(settings.problem, "");
    EXPECT_EQ(settings.remark, "line 1: unknown key 0-9az");

    settings = parseManagedSettings("a = 1\na = 2\nrestricted-mode-allowed = no\nb = 3\n");
    EXPECT_FALSE(settings.restrictedModeAllowed);
    EXPECT_EQ(settings.problem, "");
    EXPECT_EQ(settings.remark, "line 1: unknown key a and 2 more");
}

} // namespace
