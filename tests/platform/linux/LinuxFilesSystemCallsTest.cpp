#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxFiles.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/SystemCalls.h"

#include <gmock/gmock.h>

#include <cerrno>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace {

using platform::FileStream;
using platform::LinuxFiles;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

using Bytes = std::vector<std::uint8_t>;

constexpr char kPath[] = "/var/root/state";
constexpr char kRecord[] = "0123456789abc";
constexpr std::size_t kRecordSize = sizeof kRecord - 1;

Bytes recordBytes() {
    return {kRecord, kRecord + kRecordSize};
}

class LinuxFilesSystemCallsTest : public testing::Test {
  protected:
    LinuxFilesSystemCallsTest() {
        root_.makeDirectory("/var/root");
        calls_.root = std::filesystem::canonical(root_.real("/")).string();
    }

    std::unique_ptr<FileStream> stream(LinuxFiles& files) {
        return files.attachStream(files.openForWriting(kPath, platform::ProtectionClass::none,
                                                       platform::kNoClassOptions, 0600));
    }

    void save(LinuxFiles& files) {
        const auto stream = this->stream(files);
        ASSERT_NE(stream, nullptr);
        ASSERT_EQ(stream->write(kRecord, 1, kRecordSize), kRecordSize);
        ASSERT_EQ(stream->fullSync(), 0);
        ASSERT_EQ(stream->close(), 0);
    }

    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    LinuxFiles files_{root_.paths(), log_};
    support::SystemCalls calls_;
};

TEST_F(LinuxFilesSystemCallsTest, NewFileIsWrittenSyncedWithItsDirectoryAndClosed) {
    save(files_);
    EXPECT_THAT(calls_.calls, ElementsAre("fchmod /var/root/state", "pwrite /var/root/state 13",
                                          "fsync /var/root/state", "fsync /var/root",
                                          "close /var/root", "close /var/root/state"));
}

TEST_F(LinuxFilesSystemCallsTest, LaterSavesOfTheProcessLeaveTheDirectoryAlone) {
    save(files_);
    calls_.calls.clear();
    save(files_);
    EXPECT_THAT(calls_.calls, ElementsAre("pwrite /var/root/state 13", "fsync /var/root/state",
                                          "close /var/root/state"));
}

TEST_F(LinuxFilesSystemCallsTest, NextProcessSyncsTheDirectoryOfAnExistingFileOnce) {
    // The first process may have been killed between making the file and syncing its directory.
    root_.put(kPath, Bytes{1});
    LinuxFiles next{root_.paths(), log_};
    save(next);
    EXPECT_THAT(calls_.calls,
                ElementsAre("pwrite /var/root/state 13", "fsync /var/root/state", "fsync /var/root",
                            "close /var/root", "close /var/root/state"));
    calls_.calls.clear();
    save(next);
    EXPECT_THAT(calls_.calls, ElementsAre("pwrite /var/root/state 13", "fsync /var/root/state",
                                          "close /var/root/state"));
}

TEST_F(LinuxFilesSystemCallsTest, FileMadeAnewSyncsItsDirectoryAgain) {
    save(files_);
    std::filesystem::remove(root_.real(kPath));
    calls_.calls.clear();
    save(files_);
    EXPECT_THAT(calls_.calls, testing::Contains("fsync /var/root"));
}

TEST_F(LinuxFilesSystemCallsTest, EachNameIsSyncedByItself) {
    save(files_);
    calls_.calls.clear();
    const auto other = files_.attachStream(files_.openForWriting(
        "/var/root/other", platform::ProtectionClass::none, platform::kNoClassOptions, 0600));
    ASSERT_NE(other, nullptr);
    EXPECT_EQ(other->fullSync(), 0);
    EXPECT_THAT(calls_.calls, testing::Contains("fsync /var/root"));
}

TEST_F(LinuxFilesSystemCallsTest, FailedSyncIsReportedAndTheDirectoryStaysDue) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.fsyncErrors = {EIO};
    EXPECT_EQ(stream->fullSync(), EIO);
    calls_.calls.clear();
    EXPECT_EQ(stream->fullSync(), 0);
    EXPECT_THAT(calls_.calls,
                ElementsAre("fsync /var/root/state", "fsync /var/root", "close /var/root"));
}

TEST_F(LinuxFilesSystemCallsTest, FailedSyncOfTheDirectoryIsReportedAndStaysDue) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.fsyncErrors = {0, EIO};
    EXPECT_EQ(stream->fullSync(), EIO);
    calls_.calls.clear();
    EXPECT_EQ(stream->fullSync(), 0);
    EXPECT_THAT(calls_.calls,
                ElementsAre("fsync /var/root/state", "fsync /var/root", "close /var/root"));
}

TEST_F(LinuxFilesSystemCallsTest, MissingDirectoryFailsTheSync) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    std::filesystem::remove_all(root_.real("/var/root"));
    EXPECT_EQ(stream->fullSync(), ENOENT);
}

TEST_F(LinuxFilesSystemCallsTest, InterruptedCallsAreRepeated) {
    calls_.pwriteErrors = {EINTR, EINTR};
    calls_.fsyncErrors = {EINTR, 0, EINTR};
    save(files_);
    EXPECT_THAT(root_.bytesOf(kPath), Optional(recordBytes()));
    EXPECT_THAT(calls_.pwriteErrors, IsEmpty());
    EXPECT_THAT(calls_.fsyncErrors, IsEmpty());
}

TEST_F(LinuxFilesSystemCallsTest, ShortWritesAreContinued) {
    calls_.pwriteAtMost = 5;
    save(files_);
    EXPECT_THAT(root_.bytesOf(kPath), Optional(recordBytes()));
    EXPECT_THAT(calls_.calls,
                testing::IsSupersetOf({"pwrite /var/root/state 13", "pwrite /var/root/state 8",
                                       "pwrite /var/root/state 3"}));
}

TEST_F(LinuxFilesSystemCallsTest, WriteCountsWhatWasTakenBeforeAnError) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.pwriteAtMost = 5;
    calls_.pwriteErrors = {0, 0, ENOSPC};
    EXPECT_EQ(stream->write(kRecord, 1, kRecordSize), 10U);
}

TEST_F(LinuxFilesSystemCallsTest, WriteCountsWholeElementsOnly) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.pwriteAtMost = 5;
    calls_.pwriteErrors = {0, 0, ENOSPC};
    EXPECT_EQ(stream->write(kRecord, 4, 3), 2U);
}

TEST_F(LinuxFilesSystemCallsTest, WriteThatTakesNothingEnds) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.pwriteAtMost = 0;
    EXPECT_EQ(stream->write(kRecord, 1, kRecordSize), 0U);
}

TEST_F(LinuxFilesSystemCallsTest, FailedCloseIsReportedAndNotRepeated) {
    const std::size_t before = support::countOpenDescriptors();
    auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.calls.clear();
    calls_.closeErrors = {EIO};
    EXPECT_EQ(stream->close(), EIO);
    EXPECT_EQ(stream->close(), EBADF);
    stream.reset();
    EXPECT_THAT(calls_.calls, ElementsAre("close /var/root/state"));
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(LinuxFilesSystemCallsTest, InterruptedCloseIsDoneAndNotRepeated) {
    const auto stream = this->stream(files_);
    ASSERT_NE(stream, nullptr);
    calls_.calls.clear();
    calls_.closeErrors = {EINTR};
    EXPECT_EQ(stream->close(), 0);
    EXPECT_THAT(calls_.calls, ElementsAre("close /var/root/state"));
}

TEST_F(LinuxFilesSystemCallsTest, FileWhoseModeCannotBeSetIsNotLeftBehind) {
    const std::size_t before = support::countOpenDescriptors();
    calls_.fchmodErrors = {EIO};
    const platform::OpenFile file = files_.openForWriting(kPath, platform::ProtectionClass::none,
                                                          platform::kNoClassOptions, 0600);
    EXPECT_LT(file.descriptor, 0);
    EXPECT_FALSE(std::filesystem::exists(root_.real(kPath)));
    EXPECT_EQ(support::countOpenDescriptors(), before);
}

TEST_F(LinuxFilesSystemCallsTest, FailedAttachClosesNothing) {
    const int descriptor =
        files_
            .openForWriting(kPath, platform::ProtectionClass::none, platform::kNoClassOptions, 0600)
            .descriptor;
    ASSERT_GE(descriptor, 0);
    calls_.calls.clear();
    EXPECT_EQ(files_.attachStream({-1, kPath}), nullptr);
    EXPECT_THAT(calls_.calls, IsEmpty());
    EXPECT_NE(files_.attachStream({descriptor, kPath}), nullptr);
}

TEST_F(LinuxFilesSystemCallsTest, WhatFailsIsToldOnceForEachReasonUntilItWorks) {
    const auto saveWith = [this](std::deque<int> sync, std::deque<int> close) {
        const auto stream = this->stream(files_);
        calls_.fsyncErrors = std::move(sync);
        calls_.closeErrors = std::move(close);
        static_cast<void>(stream->fullSync());
        static_cast<void>(stream->close());
        std::vector<std::string> texts = log_.texts();
        log_.clear();
        return texts;
    };
    const std::string name = " /var/root/state: ";
    EXPECT_THAT(saveWith({EIO}, {}),
                ElementsAre("kstd: Files: cannot sync" + name + "Input/output error."));
    EXPECT_THAT(saveWith({EIO}, {}), IsEmpty());
    EXPECT_THAT(saveWith({ENOSPC}, {EIO}),
                ElementsAre("kstd: Files: cannot sync" + name + "No space left on device.",
                            "kstd: Files: cannot close" + name + "Input/output error."));
    // The name's own sync.
    EXPECT_THAT(saveWith({0, EIO}, {}),
                ElementsAre("kstd: Files: cannot sync" + name + "Input/output error."));
    EXPECT_THAT(saveWith({}, {}), IsEmpty());
    EXPECT_THAT(saveWith({EIO}, {EIO}).size(), 2U);
}

} // namespace
