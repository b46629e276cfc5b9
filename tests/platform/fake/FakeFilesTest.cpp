#include "platform/fake/FakeFiles.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <memory>
#include <vector>

namespace {

using platform::FakeBytes;
using platform::FakeDisk;
using platform::FakeFiles;
using platform::FileStream;
using platform::OpenFile;
using testing::ElementsAre;
using testing::Optional;

constexpr char kPath[] = "/var/root/x";
constexpr char kRecord[] = "0123456789abc";

class FakeFilesTest : public testing::Test {
  protected:
    FakeFilesTest() { disk_.makeDirectory("/var/root"); }

    OpenFile open(FakeFiles& files) {
        return files.openForWriting(kPath, platform::ProtectionClass::none,
                                    platform::kNoClassOptions, 0600);
    }

    std::unique_ptr<FileStream> stream() { return files_.attachStream(open(files_)); }

    /// Writes 13 bytes of this value, and syncs them if asked to.
    void write(std::uint8_t value, bool sync) {
        const FakeBytes bytes(13, value);
        const auto stream = this->stream();
        ASSERT_NE(stream, nullptr);
        ASSERT_EQ(stream->write(bytes.data(), 1, bytes.size()), bytes.size());
        if (sync) {
            ASSERT_EQ(stream->fullSync(), 0);
        }
    }

    FakeDisk disk_;
    FakeFiles files_{disk_};
};

TEST_F(FakeFilesTest, CallsAreNotedInTheirOrder) {
    {
        const auto stream = this->stream();
        EXPECT_EQ(stream->write(kRecord, 1, 13), 13U);
        EXPECT_EQ(stream->fullSync(), 0);
        EXPECT_EQ(stream->close(), 0);
        EXPECT_EQ(stream->close(), EBADF);
    }
    static_cast<void>(files_.load(kPath));
    EXPECT_THAT(files_.calls(), ElementsAre("open /var/root/x", "attach", "write 13", "sync",
                                            "close", "close", "load /var/root/x"));
    files_.clearCalls();
    EXPECT_THAT(files_.calls(), ElementsAre());
}

TEST_F(FakeFilesTest, StreamDestroyedOpenIsNotedAsClosed) {
    static_cast<void>(stream());
    EXPECT_THAT(files_.calls(), ElementsAre("open /var/root/x", "attach", "close"));
}

TEST_F(FakeFilesTest, ProtectionClassIsRemembered) {
    EXPECT_EQ(files_.protectionOf(kPath), std::nullopt);
    static_cast<void>(stream());
    EXPECT_EQ(files_.protectionOf(kPath),
              (platform::FakeFiles::Protection{platform::ProtectionClass::none, 0}));
}

TEST_F(FakeFilesTest, FailedOpenHappensOnceAndMakesNothing) {
    files_.failures.open = true;
    EXPECT_LT(open(files_).descriptor, 0);
    EXPECT_EQ(disk_.find(kPath), nullptr);
    EXPECT_NE(stream(), nullptr);
}

TEST_F(FakeFilesTest, FailedAttachLeavesTheDescriptorOpen) {
    const OpenFile file = open(files_);
    files_.failures.attach = true;
    EXPECT_EQ(files_.attachStream(file), nullptr);
    EXPECT_EQ(files_.openDescriptors(), 1U);
    EXPECT_EQ(files_.openStreams(), 0U);
    EXPECT_NE(files_.attachStream(file), nullptr);
}

TEST_F(FakeFilesTest, ShortWriteTakesWhatItWasToldTo) {
    const auto stream = this->stream();
    files_.failures.writeAtMost = 5;
    EXPECT_EQ(stream->write(kRecord, 1, 13), 5U);
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes({'0', '1', '2', '3', '4'})));
    EXPECT_EQ(stream->write(kRecord, 1, 13), 13U);
    EXPECT_EQ(disk_.read(kPath)->size(), 18U);
}

TEST_F(FakeFilesTest, ShortWriteCountsWholeElements) {
    const auto stream = this->stream();
    files_.failures.writeAtMost = 11;
    EXPECT_EQ(stream->write(kRecord, 4, 3), 2U);
}

TEST_F(FakeFilesTest, FailedSyncGivesItsErrorAndSyncsNothing) {
    const auto stream = this->stream();
    EXPECT_EQ(stream->write(kRecord, 1, 13), 13U);
    files_.failures.sync = EIO;
    EXPECT_EQ(stream->fullSync(), EIO);
    EXPECT_FALSE(disk_.find(kPath)->nameSynced);
    EXPECT_TRUE(disk_.find(kPath)->syncedBytes.empty());
    EXPECT_EQ(stream->fullSync(), 0);
}

TEST_F(FakeFilesTest, FailedCloseClosesAllTheSame) {
    const auto stream = this->stream();
    files_.failures.close = EIO;
    EXPECT_EQ(stream->close(), EIO);
    EXPECT_EQ(files_.openDescriptors(), 0U);
    EXPECT_EQ(files_.openStreams(), 0U);
    EXPECT_EQ(stream->close(), EBADF);
}

TEST_F(FakeFilesTest, FailedLoadHappensOnce) {
    disk_.put(kPath, {1});
    files_.failures.load = true;
    EXPECT_EQ(files_.load(kPath), std::nullopt);
    EXPECT_THAT(files_.load(kPath), Optional(FakeBytes{1}));
}

TEST_F(FakeFilesTest, LowestFreeDescriptorIsGivenOutNext) {
    const OpenFile first = open(files_);
    const OpenFile second = open(files_);
    EXPECT_EQ(second.descriptor, first.descriptor + 1);
    files_.closeDescriptor(first.descriptor);
    EXPECT_EQ(open(files_).descriptor, first.descriptor);
}

TEST_F(FakeFilesTest, CrashTakesAFileWhoseNameWasNotSynced) {
    write(1, false);
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 1)));
    files_.crash();
    EXPECT_EQ(disk_.read(kPath), std::nullopt);
}

TEST_F(FakeFilesTest, CrashKeepsWhatWasSynced) {
    write(1, true);
    files_.crash();
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 1)));
}

TEST_F(FakeFilesTest, CrashBringsTheOldBytesBack) {
    write(1, true);
    write(2, false);
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 2)));
    files_.crash();
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 1)));
}

TEST_F(FakeFilesTest, NextProcessSyncsTheNameThatTheFirstLeftUnsynced) {
    write(1, false);
    FakeFiles next(disk_);
    {
        const auto stream = next.attachStream(open(next));
        ASSERT_NE(stream, nullptr);
        EXPECT_EQ(stream->fullSync(), 0);
    }
    disk_.crash();
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 1)));
}

TEST_F(FakeFilesTest, FileMadeAnewNeedsItsNameSyncedAgain) {
    write(1, true);
    disk_.remove(kPath);
    write(2, false);
    disk_.crash();
    EXPECT_EQ(disk_.read(kPath), std::nullopt);
    write(3, true);
    disk_.crash();
    EXPECT_THAT(disk_.read(kPath), Optional(FakeBytes(13, 3)));
}

TEST_F(FakeFilesTest, FileRemovedWhileOpenStaysGone) {
    const auto stream = this->stream();
    disk_.remove(kPath);
    EXPECT_EQ(stream->write(kRecord, 1, 13), 13U);
    EXPECT_EQ(disk_.read(kPath), std::nullopt);
}

TEST(FakeDiskDeathTest, PuttingAFileIntoAMissingDirectoryIsAnErrorInTheTest) {
    FakeDisk disk;
    EXPECT_DEATH(disk.put("/missing/x", {}), "error in the test: a file was put where");
}

} // namespace
