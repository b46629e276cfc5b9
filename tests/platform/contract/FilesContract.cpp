#include "tests/platform/contract/FilesContract.h"

#include <gmock/gmock.h>

#include <limits>

namespace contract {

namespace {

using platform::FileStream;
using platform::kMaxLoadSize;
using platform::OpenFile;
using testing::Optional;

constexpr char kPath[] = "/var/root/state";
constexpr char kOther[] = "/var/root/other";

Bytes run(std::size_t length, std::uint8_t value) {
    return Bytes(length, value);
}

} // namespace

OpenFile FilesContract::open(const std::string& path, unsigned mode) {
    return files().openForWriting(path, platform::ProtectionClass::none, platform::kNoClassOptions,
                                  mode);
}

std::unique_ptr<FileStream> FilesContract::stream(const std::string& path) {
    return files().attachStream(open(path));
}

std::size_t FilesContract::write(FileStream& stream, const Bytes& bytes) {
    return stream.write(bytes.data(), 1, bytes.size());
}

TEST_P(FilesContract, NewFileIsEmptyAndHasExactlyTheMode) {
    for (const unsigned mode : {0600U, 0644U, 0666U, 0400U}) {
        const std::string path = kPath + std::to_string(mode);
        const auto stream = files().attachStream(open(path, mode));
        ASSERT_NE(stream, nullptr);
        EXPECT_EQ(fixture().modeOf(path), mode);
        EXPECT_THAT(fixture().bytesOf(path), Optional(Bytes()));
    }
}

TEST_P(FilesContract, OpenFileKnowsItsPath) {
    const OpenFile file = open(kPath);
    ASSERT_GE(file.descriptor, 0);
    EXPECT_EQ(file.path, kPath);
    fixture().closeDescriptor(file.descriptor);
}

TEST_P(FilesContract, ExistingFileKeepsItsModeAndItsBytes) {
    fixture().put(kPath, run(32, 0xaa), 0640);
    const auto stream = files().attachStream(open(kPath, 0600));
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(fixture().modeOf(kPath), 0640U);
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(run(32, 0xaa)));
}

TEST_P(FilesContract, EveryProtectionClassIsAccepted) {
    for (const int value : {1, 2, 3, 4}) {
        const OpenFile file = files().openForWriting(kPath, platform::ProtectionClass{value},
                                                     platform::kNoClassOptions, 0600);
        ASSERT_GE(file.descriptor, 0) << value;
        fixture().closeDescriptor(file.descriptor);
    }
}

TEST_P(FilesContract, MissingDirectoryGivesNoDescriptorAndMakesNothing) {
    const OpenFile file = open("/var/root/missing/state");
    EXPECT_LT(file.descriptor, 0);
    EXPECT_EQ(fixture().openDescriptors(), 0U);
    EXPECT_EQ(fixture().bytesOf("/var/root/missing/state"), std::nullopt);
}

TEST_P(FilesContract, DirectoryIsNotOpened) {
    fixture().makeDirectory(kPath);
    EXPECT_LT(open(kPath).descriptor, 0);
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, WrittenBytesAreReadBackBeforeAnySync) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(write(*stream, run(13, 0x5a)), 13U);
    EXPECT_THAT(files().load(kPath), Optional(run(13, 0x5a)));
}

TEST_P(FilesContract, ShorterWriteKeepsTheTail) {
    fixture().put(kPath, run(32, 0xaa), 0600);
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(write(*stream, run(13, 0x5a)), 13U);
    Bytes expected = run(32, 0xaa);
    std::fill_n(expected.begin(), 13, std::uint8_t{0x5a});
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(expected));
}

TEST_P(FilesContract, SecondWriteGoesOnBehindTheFirst) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(write(*stream, {1, 2, 3}), 3U);
    EXPECT_EQ(write(*stream, {4, 5}), 2U);
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(Bytes{1, 2, 3, 4, 5}));
}

TEST_P(FilesContract, WriteCountsElements) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    const Bytes bytes = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    EXPECT_EQ(stream->write(bytes.data(), 4, 3), 3U);
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(bytes));
}

TEST_P(FilesContract, WritingNothingIsNoFailure) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream->write(nullptr, 1, 0), 0U);
    EXPECT_EQ(stream->fullSync(), 0);
    EXPECT_EQ(stream->close(), 0);
    EXPECT_THAT(files().load(kPath), Optional(Bytes()));
}

TEST_P(FilesContract, SizeBeyondAllMemoryWritesNothing) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    const Bytes bytes = run(16, 1);
    EXPECT_EQ(stream->write(bytes.data(), 16, std::numeric_limits<std::size_t>::max() / 8), 0U);
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(Bytes()));
}

TEST_P(FilesContract, WriteSyncCloseSucceedAndCloseTheDescriptor) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(fixture().openDescriptors(), 1U);
    EXPECT_EQ(write(*stream, run(13, 1)), 13U);
    EXPECT_EQ(stream->fullSync(), 0);
    EXPECT_EQ(stream->close(), 0);
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, DestroyedStreamIsClosed) {
    auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(fixture().openDescriptors(), 1U);
    stream.reset();
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, ClosedStreamDoesNothingMore) {
    const auto stream = this->stream(kPath);
    ASSERT_NE(stream, nullptr);
    ASSERT_EQ(stream->close(), 0);
    EXPECT_EQ(write(*stream, {1}), 0U);
    EXPECT_NE(stream->fullSync(), 0);
    EXPECT_NE(stream->close(), 0);
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(Bytes()));
}

TEST_P(FilesContract, SecondCloseLeavesTheDescriptorsNextOwnerAlone) {
    auto first = this->stream(kPath);
    ASSERT_NE(first, nullptr);
    ASSERT_EQ(first->close(), 0);
    const auto second = this->stream(kOther);
    ASSERT_NE(second, nullptr);
    EXPECT_NE(first->close(), 0);
    first.reset();
    EXPECT_EQ(fixture().openDescriptors(), 1U);
    EXPECT_EQ(write(*second, {7}), 1U);
    EXPECT_EQ(second->close(), 0);
    EXPECT_THAT(fixture().bytesOf(kOther), Optional(Bytes{7}));
    EXPECT_THAT(fixture().bytesOf(kPath), Optional(Bytes()));
}

TEST_P(FilesContract, NoStreamOnWhatIsNoDescriptor) {
    EXPECT_EQ(files().attachStream(OpenFile{-1, kPath}), nullptr);
}

TEST_P(FilesContract, NoStreamOnAClosedDescriptor) {
    const OpenFile file = open(kPath);
    ASSERT_GE(file.descriptor, 0);
    fixture().closeDescriptor(file.descriptor);
    EXPECT_EQ(files().attachStream(file), nullptr);
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, MissingFileLoadsAsNone) {
    EXPECT_EQ(files().load(kPath), std::nullopt);
    EXPECT_EQ(files().load("/var/root/missing/state"), std::nullopt);
}

TEST_P(FilesContract, EmptyFileLoadsAsAnEmptyBuffer) {
    fixture().put(kPath, {}, 0600);
    EXPECT_THAT(files().load(kPath), Optional(Bytes()));
}

TEST_P(FilesContract, DirectoryLoadsAsNone) {
    fixture().makeDirectory(kPath);
    EXPECT_EQ(files().load(kPath), std::nullopt);
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, LoadsAllBytesOfAFile) {
    for (const std::size_t size : {1UL, 12UL, 13UL, 32UL, 4095UL, 4096UL, 4097UL, 100000UL}) {
        Bytes bytes(size);
        for (std::size_t i = 0; i < size; ++i) {
            bytes[i] = static_cast<std::uint8_t>(i * 7);
        }
        fixture().put(kPath, bytes, 0600);
        EXPECT_EQ(files().load(kPath), bytes) << size;
    }
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

TEST_P(FilesContract, LocatesFilesUnderTheRealRoot) {
    EXPECT_EQ(files().locate("/var/root/x.db"), fixture().real("/var/root/x.db"));
}

TEST_P(FilesContract, LoadsUpToTheLargestSizeAndOfALongerFileTheBeginning) {
    for (const std::size_t size : {kMaxLoadSize - 1, kMaxLoadSize}) {
        fixture().put(kPath, run(size, 3), 0600);
        const auto loaded = files().load(kPath);
        ASSERT_TRUE(loaded.has_value()) << size;
        EXPECT_EQ(loaded->size(), size);
    }
    Bytes longer = run(kMaxLoadSize, 3);
    longer.push_back(4);
    fixture().put(kPath, longer, 0600);
    EXPECT_THAT(files().load(kPath), Optional(run(kMaxLoadSize, 3)));
    EXPECT_EQ(fixture().openDescriptors(), 0U);
}

} // namespace contract
