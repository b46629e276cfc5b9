#include "platform/linux/LinuxFiles.h"

#include "base/NotCopied.h"
#include "platform/fake/FakeSystemLog.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using platform::FileStream;
using platform::OpenFile;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

using Bytes = std::vector<std::uint8_t>;

constexpr char kPath[] = "/var/root/state";

/// Sets the umask, until it is destroyed.
class Umask : private base::NotCopied {
  public:
    explicit Umask(mode_t mask) : before_(::umask(mask)) {}
    ~Umask() { ::umask(before_); }

  private:
    mode_t before_;
};

class LinuxFilesTest : public testing::Test {
  protected:
    LinuxFilesTest() { root_.makeDirectory("/var/root"); }

    OpenFile open(const std::string& path, unsigned mode = 0600) {
        return files_.openForWriting(path, platform::ProtectionClass::none,
                                     platform::kNoClassOptions, mode);
    }

    /// The lines since the last call.
    std::vector<std::string> warnings() {
        for (const auto& line : log_.lines()) {
            EXPECT_EQ(line.level, platform::LogLevel::warning);
        }
        std::vector<std::string> texts = log_.texts();
        log_.clear();
        return texts;
    }

    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::LinuxFiles files_{root_.paths(), log_};
};

TEST_F(LinuxFilesTest, ModeIsExactUnderEveryUmask) {
    for (const mode_t mask : {0U, 022U, 077U, 0277U, 0777U}) {
        for (const unsigned mode : {0600U, 0644U, 0666U}) {
            const Umask umask(mask);
            const std::string path = kPath + std::to_string(mask) + "-" + std::to_string(mode);
            const auto stream = files_.attachStream(open(path, mode));
            ASSERT_NE(stream, nullptr);
            EXPECT_EQ(root_.modeOf(path), mode) << mask;
        }
    }
}

TEST_F(LinuxFilesTest, DescriptorIsClosedOnExec) {
    const OpenFile file = open(kPath);
    ASSERT_GE(file.descriptor, 0);
    EXPECT_EQ(::fcntl(file.descriptor, F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
    EXPECT_EQ(::fcntl(file.descriptor, F_GETFL) & O_ACCMODE, O_RDWR);
    ::close(file.descriptor);
    const OpenFile again = open(kPath);
    ASSERT_GE(again.descriptor, 0);
    EXPECT_EQ(::fcntl(again.descriptor, F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
    ::close(again.descriptor);
}

TEST_F(LinuxFilesTest, OpeningMakesNoDirectories) {
    EXPECT_LT(open("/var/root/a/b").descriptor, 0);
    EXPECT_LT(open("/opt/state").descriptor, 0);
    EXPECT_FALSE(std::filesystem::exists(root_.real("/var/root/a")));
    EXPECT_FALSE(std::filesystem::exists(root_.real("/opt")));
}

TEST_F(LinuxFilesTest, LinkIsNotFollowedForWriting) {
    root_.put("/var/root/target", Bytes{1});
    std::filesystem::create_symlink("target", root_.real(kPath));
    EXPECT_LT(open(kPath).descriptor, 0);
    EXPECT_THAT(root_.bytesOf("/var/root/target"), Optional(Bytes{1}));
}

TEST_F(LinuxFilesTest, LinkToNothingMakesNoFile) {
    std::filesystem::create_symlink("target", root_.real(kPath));
    EXPECT_LT(open(kPath).descriptor, 0);
    EXPECT_FALSE(std::filesystem::exists(root_.real("/var/root/target")));
}

TEST_F(LinuxFilesTest, LinkIsNotFollowedForLoading) {
    root_.put("/var/root/target", Bytes{1});
    std::filesystem::create_symlink("target", root_.real(kPath));
    EXPECT_EQ(files_.load(kPath), std::nullopt);
    EXPECT_THAT(warnings(), ElementsAre("kstd: Files: cannot load /var/root/state: Too many levels "
                                        "of symbolic links."));
}

TEST_F(LinuxFilesTest, MissingFileIsNoFailureToLoad) {
    EXPECT_EQ(files_.load(kPath), std::nullopt);
    EXPECT_EQ(files_.load("/nowhere/at/all"), std::nullopt);
    EXPECT_THAT(warnings(), IsEmpty());
}

TEST_F(LinuxFilesTest, EachReasonIsToldOnceUntilItWorks) {
    const std::string toLoad = "kstd: Files: cannot load /var/root/state: ";
    const auto load = [this] {
        static_cast<void>(files_.load(kPath));
        return warnings();
    };
    for (int round = 0; round < 2; ++round) {
        root_.makeDirectory(kPath);
        EXPECT_THAT(load(), ElementsAre(toLoad + "not a regular file.")) << round;
        EXPECT_THAT(load(), IsEmpty());
        std::filesystem::remove(root_.real(kPath));
        std::filesystem::create_symlink("target", root_.real(kPath));
        EXPECT_THAT(load(), ElementsAre(toLoad + "Too many levels of symbolic links."));
        EXPECT_THAT(load(), IsEmpty());
        std::filesystem::remove(root_.real(kPath));
        root_.put(kPath, Bytes{1});
        EXPECT_THAT(load(), IsEmpty());
        std::filesystem::remove(root_.real(kPath));
    }
}

TEST_F(LinuxFilesTest, WhatCannotBeOpenedIsToldWithTheReason) {
    EXPECT_LT(open("/nowhere/state").descriptor, 0);
    EXPECT_LT(open("/nowhere/state").descriptor, 0);
    EXPECT_LT(open("/nowhere/other").descriptor, 0);
    std::filesystem::create_symlink("target", root_.real(kPath));
    EXPECT_LT(open(kPath).descriptor, 0);
    EXPECT_THAT(
        warnings(),
        ElementsAre(
            "kstd: Files: cannot open /nowhere/state: No such file or directory.",
            "kstd: Files: cannot open /nowhere/other: No such file or directory.",
            "kstd: Files: cannot open /var/root/state: Too many levels of symbolic links."));
}

TEST_F(LinuxFilesTest, WritingToAFullDeviceIsTold) {
    platform::LinuxFiles files{platform::Paths("/"), log_};
    for (int round = 0; round < 2; ++round) {
        const auto stream = files.attachStream(files.openForWriting(
            "/dev/full", platform::ProtectionClass::none, platform::kNoClassOptions, 0600));
        ASSERT_NE(stream, nullptr);
        EXPECT_EQ(stream->write("x", 1, 1), 0U);
    }
    EXPECT_THAT(warnings(),
                ElementsAre("kstd: Files: cannot write /dev/full: No space left on device."));
}

TEST_F(LinuxFilesTest, StreamBeginsAtTheStartWhereverTheDescriptorStands) {
    root_.put(kPath, Bytes{1, 2, 3, 4});
    const OpenFile file = open(kPath);
    ASSERT_EQ(::lseek(file.descriptor, 3, SEEK_SET), 3);
    const auto stream = files_.attachStream(file);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write("\x09", 1, 1), 1U);
    EXPECT_THAT(root_.bytesOf(kPath), Optional(Bytes{9, 2, 3, 4}));
}

TEST_F(LinuxFilesTest, FullDeviceFailsAtTheWrite) {
    const OpenFile file{::open("/dev/full", O_RDWR | O_CLOEXEC), "/dev/full"};
    ASSERT_GE(file.descriptor, 0);
    const auto stream = files_.attachStream(file);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write("0123456789abc", 1, 13), 0U);
    EXPECT_EQ(stream->close(), 0);
}

TEST_F(LinuxFilesTest, FullDeviceOpensUnderItsPath) {
    platform::LinuxFiles files{platform::Paths("/"), log_};
    const auto stream = files.attachStream(files.openForWriting(
        "/dev/full", platform::ProtectionClass::none, platform::kNoClassOptions, 0600));
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write("0123456789abc", 1, 13), 0U);
}

TEST_F(LinuxFilesTest, NoStreamOnADescriptorThatCannotBeWritten) {
    root_.put(kPath, Bytes{1});
    for (const int flags : {O_RDONLY, O_PATH}) {
        const OpenFile file{::open(root_.real(kPath).c_str(), flags | O_CLOEXEC), kPath};
        ASSERT_GE(file.descriptor, 0);
        EXPECT_EQ(files_.attachStream(file), nullptr);
        EXPECT_GE(::fcntl(file.descriptor, F_GETFD), 0) << "the descriptor was closed";
        ::close(file.descriptor);
    }
}

TEST_F(LinuxFilesTest, StreamOnADescriptorForWritingOnly) {
    root_.put(kPath, Bytes{1});
    const auto stream =
        files_.attachStream({::open(root_.real(kPath).c_str(), O_WRONLY | O_CLOEXEC), kPath});
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write("\x07", 1, 1), 1U);
    EXPECT_THAT(root_.bytesOf(kPath), Optional(Bytes{7}));
}

TEST_F(LinuxFilesTest, SecondCloseAndDestructionSpareAReusedNumber) {
    const OpenFile file = open(kPath);
    auto stream = files_.attachStream(file);
    ASSERT_NE(stream, nullptr);
    ASSERT_EQ(stream->close(), 0);
    const int reused = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    ASSERT_EQ(reused, file.descriptor);
    EXPECT_EQ(stream->close(), EBADF);
    EXPECT_EQ(stream->close(), EBADF);
    EXPECT_EQ(stream->fullSync(), EBADF);
    EXPECT_EQ(stream->write("x", 1, 1), 0U);
    stream.reset();
    EXPECT_GE(::fcntl(reused, F_GETFD), 0) << "another owner's descriptor was closed";
    ::close(reused);
}

TEST_F(LinuxFilesTest, ManySavesLeaveNoDescriptor) {
    const std::size_t before = support::countOpenDescriptors();
    for (int i = 0; i < 200; ++i) {
        const auto stream = files_.attachStream(open(kPath));
        ASSERT_NE(stream, nullptr);
        ASSERT_EQ(stream->write("0123456789abc", 1, 13), 13U);
        ASSERT_EQ(stream->fullSync(), 0);
        ASSERT_EQ(stream->close(), 0);
        ASSERT_TRUE(files_.load(kPath).has_value());
    }
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(LinuxFilesTest, PipeLoadsAsNoneWithoutWaiting) {
    ASSERT_EQ(::mkfifo(root_.real(kPath).c_str(), 0600), 0);
    const std::size_t before = support::countOpenDescriptors();
    EXPECT_EQ(files_.load(kPath), std::nullopt);
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(LinuxFilesTest, PipeFailsAtTheWrite) {
    ASSERT_EQ(::mkfifo(root_.real(kPath).c_str(), 0600), 0);
    const auto stream = files_.attachStream(open(kPath));
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write("x", 1, 1), 0U);
}

TEST_F(LinuxFilesTest, DeviceLoadsAsNone) {
    platform::LinuxFiles files{platform::Paths("/"), log_};
    EXPECT_EQ(files.load("/dev/zero"), std::nullopt);
}

TEST_F(LinuxFilesTest, OfAHugeSparseFileTheBeginningIsLoaded) {
    root_.put(kPath, Bytes());
    std::filesystem::resize_file(root_.real(kPath), std::uintmax_t{1} << 40U);
    EXPECT_THAT(files_.load(kPath), Optional(Bytes(platform::kMaxLoadSize)));
}

TEST_F(LinuxFilesTest, FileWithoutAnAnnouncedSizeLoadsWhole) {
    platform::LinuxFiles files{platform::Paths("/"), log_};
    const auto loaded = files.load("/proc/self/status");
    ASSERT_TRUE(loaded.has_value());
    const std::string text(loaded->begin(), loaded->end());
    EXPECT_EQ(text.find("Name:"), 0U);
    EXPECT_NE(text.find("nonvoluntary_ctxt_switches:"), std::string::npos) << "the end is missing";
}

TEST_F(LinuxFilesTest, FileThatCannotBeOpenedLoadsAsNone) {
    // Opening a link that leads back to itself fails for everybody, root included.
    std::filesystem::create_symlink("state", root_.real(kPath));
    EXPECT_EQ(files_.load(kPath), std::nullopt);
}

} // namespace
