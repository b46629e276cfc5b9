#include "platform/linux/LinuxSystemLog.h"

#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <string>

namespace {

using platform::LinuxSystemLog;
using platform::LogLevel;
using testing::ElementsAre;

constexpr std::size_t kMax = LinuxSystemLog::kMaxTextSize;

class LinuxSystemLogTest : public testing::Test {
  protected:
    std::string written(std::string_view text) {
        const support::StandardErrorCapture standardError;
        log_.write(LogLevel::info, text, {});
        return standardError.text();
    }

    support::RootDirectory root_;
    LinuxSystemLog log_{root_.paths()};
};

TEST_F(LinuxSystemLogTest, LineIsPlainTextWhateverItsLevelAndPlace) {
    const support::StandardErrorCapture standardError;
    log_.write(LogLevel::error, "kstd: main: text.\n", {"kstd/KSTService", 12, "main"});
    EXPECT_EQ(standardError.text(), "kstd: main: text.\n");
}

TEST_F(LinuxSystemLogTest, TextUpToTheLimitStaysWhole) {
    for (const std::size_t size : {kMax - 1, kMax}) {
        const std::string text(size, 'x');
        EXPECT_EQ(written(text), text + "\n");
        EXPECT_EQ(written(text + "\n"), text + "\n");
    }
}

TEST_F(LinuxSystemLogTest, LongerTextIsCut) {
    const std::string kept(kMax, 'x');
    EXPECT_EQ(written(kept + "y"), kept + "...\n");
    EXPECT_EQ(written(kept + "y\n"), kept + "...\n");
    EXPECT_EQ(written(kept + "\n\n"), kept + "...\n");
    EXPECT_EQ(written(kept + std::string(1000000, 'y')), kept + "...\n");
}

TEST_F(LinuxSystemLogTest, NewlineBeforeTheCutIsShown) {
    const std::string kept(kMax - 1, 'x');
    EXPECT_EQ(written(kept + "\nyyyy"), kept + "\\n...\n");
}

TEST_F(LinuxSystemLogTest, TextIsCutAtTheStartOfACharacter) {
    const std::string character = "\xf0\x9f\x94\x91";
    for (std::size_t inside = 0; inside <= 4; ++inside) {
        const std::string kept(kMax - inside, 'x');
        const std::string text = kept + character + character;
        const std::string expected = inside == 4 ? kept + character : kept;
        EXPECT_EQ(written(text), expected + "...\n") << inside;
    }
}

TEST_F(LinuxSystemLogTest, TextThatIsNoUtf8IsCutAllTheSame) {
    const std::string line = written(std::string(kMax * 2, '\x80'));
    EXPECT_LE(line.size(), 4 * kMax + 4);
    EXPECT_GE(line.size(), 4 * (kMax - 3) + 4);
    EXPECT_TRUE(line.ends_with("\\x80...\n"));
}

TEST_F(LinuxSystemLogTest, EveryLengthThatIsShownLongestStaysWhole) {
    for (const std::size_t size : {std::size_t{1023}, std::size_t{1024}, std::size_t{1025}, kMax}) {
        std::string expected;
        for (std::size_t count = 0; count < size; ++count) {
            expected += "\\x01";
        }
        EXPECT_EQ(written(std::string(size, '\x01')), expected + "\n") << size;
    }
}

TEST_F(LinuxSystemLogTest, JournalOfAnotherRootIsNotUsed) {
    root_.makeDirectory("/run/systemd/journal");
    root_.put("/run/systemd/journal/socket", "");
    EXPECT_EQ(written("text\n"), "text\n");
}

TEST_F(LinuxSystemLogTest, NothingHappensWithoutStandardError) {
    const int kept = ::dup(STDERR_FILENO);
    ::close(STDERR_FILENO);
    log_.write(LogLevel::error, "text\n", {});
    EXPECT_EQ(::dup2(kept, STDERR_FILENO), STDERR_FILENO);
    ::close(kept);
}

} // namespace
