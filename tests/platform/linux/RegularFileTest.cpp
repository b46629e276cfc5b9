#include "platform/linux/RegularFile.h"

#include "tests/platform/linux/RootDirectory.h"
#include "tests/support/FailingCalls.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <sys/stat.h>
#include <vector>

namespace {

using platform::ReadFailure;
using platform::readRegularFile;
using platform::RegularFile;

using Bytes = std::vector<std::uint8_t>;

class RegularFileTest : public testing::Test {
  protected:
    RegularFile read(std::size_t limit) { return readRegularFile(root_.real("/file"), limit); }

    support::RootDirectory root_;
};

TEST_F(RegularFileTest, ReadsUpToTheLimit) {
    for (const std::size_t size : {0UL, 1UL, 9UL, 10UL}) {
        root_.put("/file", Bytes(size, 5));
        const RegularFile file = read(10);
        EXPECT_EQ(file.failure, ReadFailure::none) << size;
        EXPECT_EQ(file.bytes, Bytes(size, 5));
    }
}

TEST_F(RegularFileTest, OneByteBeyondTheLimitIsTooLarge) {
    root_.put("/file", Bytes(11, 5));
    const RegularFile file = read(10);
    EXPECT_EQ(file.failure, ReadFailure::tooLarge);
    EXPECT_TRUE(file.bytes.empty());
}

TEST_F(RegularFileTest, LimitOfNothingTakesAnEmptyFile) {
    root_.put("/file", Bytes());
    EXPECT_EQ(read(0).failure, ReadFailure::none);
    root_.put("/file", Bytes(1, 5));
    EXPECT_EQ(read(0).failure, ReadFailure::tooLarge);
}

TEST_F(RegularFileTest, TellsModeAndOwner) {
    root_.put("/file", Bytes(3, 5), 0640);
    const RegularFile file = read(10);
    EXPECT_EQ(file.status.st_mode & 07777U, 0640U);
    EXPECT_EQ(file.status.st_size, 3);
}

TEST_F(RegularFileTest, MissingFileIsToldFromUnreadable) {
    EXPECT_EQ(read(10).failure, ReadFailure::missing);
    EXPECT_EQ(read(10).error, ENOENT);
    EXPECT_EQ(distrust(read(10), 10), "cannot be read: No such file or directory");
    root_.put("/file", Bytes());
    const RegularFile below = readRegularFile(root_.real("/file/below"), 10);
    EXPECT_EQ(below.failure, ReadFailure::unreadable);
    EXPECT_EQ(below.error, ENOTDIR);
}

TEST_F(RegularFileTest, FailedReadIsUnreadable) {
    const RegularFile file = readRegularFile("/proc/self/mem", 10);
    EXPECT_EQ(file.failure, ReadFailure::unreadable);
    EXPECT_EQ(file.error, EIO);
    EXPECT_TRUE(file.bytes.empty());
}

TEST_F(RegularFileTest, InterruptedReadIsDoneAgain) {
    root_.put("/file", Bytes(3, 5));
    support::FailingCalls::read = {EINTR, EINTR};
    EXPECT_EQ(read(10).bytes, Bytes(3, 5));
    EXPECT_TRUE(support::FailingCalls::read.empty());
}

TEST_F(RegularFileTest, FileThatCannotBeLookedAtIsUnreadable) {
    root_.put("/file", Bytes(3, 5));
    support::FailingCalls::fstat = {EIO};
    const RegularFile file = read(10);
    EXPECT_EQ(file.failure, ReadFailure::unreadable);
    EXPECT_EQ(file.error, EIO);
    EXPECT_EQ(distrust(file, 10), "cannot be read: Input/output error");
}

TEST_F(RegularFileTest, OtherKindsOfFileAreNotRead) {
    EXPECT_EQ(readRegularFile(root_.real("/"), 10).failure, ReadFailure::notRegular);
    EXPECT_EQ(readRegularFile("/dev/zero", 10).failure, ReadFailure::notRegular);
    ASSERT_EQ(::mkfifo(root_.real("/pipe").c_str(), 0600), 0);
    EXPECT_EQ(readRegularFile(root_.real("/pipe"), 10).failure, ReadFailure::notRegular);
}

} // namespace
