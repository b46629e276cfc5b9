#include "platform/fake/FakeFiles.h"

#include "base/Concat.h"
#include "base/FileNames.h"
#include "platform/fake/FakeFormats.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform {

void FakeFile::write(std::size_t offset, const std::uint8_t* data, std::size_t size) {
    bytes.resize(std::max(bytes.size(), offset + size));
    std::copy_n(data, size, bytes.begin() + static_cast<std::ptrdiff_t>(offset));
}

bool FakeDisk::isDirectory(std::string_view path) const {
    return directories_.contains(path);
}

std::shared_ptr<FakeFile> FakeDisk::find(std::string_view path) const {
    const auto found = files_.find(path);
    return found == files_.end() ? nullptr : found->second;
}

std::shared_ptr<FakeFile> FakeDisk::make(std::string_view path, unsigned mode) {
    if (!isDirectory(base::directoryOf(path)) || isDirectory(path)) {
        return nullptr;
    }
    auto file = std::make_shared<FakeFile>();
    file->mode = mode;
    files_.insert_or_assign(std::string(path), file);
    return file;
}

void FakeDisk::put(std::string_view path, const FakeBytes& bytes, unsigned mode) {
    const std::shared_ptr<FakeFile> file = make(path, mode);
    if (!file) {
        testError("a file was put where its directory is missing");
    }
    file->bytes = bytes;
    file->syncedBytes = bytes;
    file->nameSynced = true;
}

void FakeDisk::remove(std::string_view path) {
    const auto found = files_.find(path);
    if (found != files_.end()) {
        files_.erase(found);
    }
}

std::optional<FakeBytes> FakeDisk::read(std::string_view path) const {
    const std::shared_ptr<FakeFile> file = find(path);
    return file ? std::optional(file->bytes) : std::nullopt;
}

void FakeDisk::crash() {
    std::erase_if(files_, [](const auto& entry) { return !entry.second->nameSynced; });
    for (auto& [path, file] : files_) {
        file->bytes = file->syncedBytes;
    }
}

FakeFileStream::FakeFileStream(FakeFiles& files, int descriptor, std::shared_ptr<FakeFile> file,
                               std::string path)
    : files_(files), descriptor_(descriptor), file_(std::move(file)), path_(std::move(path)) {
    ++files_.openStreams_;
}

FakeFileStream::~FakeFileStream() {
    if (file_) {
        static_cast<void>(closeNow());
    }
}

std::size_t FakeFileStream::write(const void* data, std::size_t elementSize, std::size_t count) {
    std::size_t size = 0;
    if (__builtin_mul_overflow(elementSize, count, &size)) {
        return 0;
    }
    files_.calls_.push_back(base::concat("write ", size));
    if (!file_ || size == 0) {
        return 0;
    }
    size = std::min(size, std::exchange(files_.failures.writeAtMost, std::nullopt).value_or(size));
    file_->write(position_, static_cast<const std::uint8_t*>(data), size);
    position_ += size;
    return size / elementSize;
}

int FakeFileStream::fullSync() {
    files_.calls_.emplace_back("sync");
    return file_ ? files_.sync(*file_, path_) : EBADF;
}

int FakeFileStream::close() {
    if (file_) {
        return closeNow();
    }
    files_.calls_.emplace_back("close");
    return EBADF;
}

int FakeFileStream::closeNow() {
    files_.calls_.emplace_back("close");
    files_.descriptors_.erase(descriptor_);
    --files_.openStreams_;
    file_.reset();
    return std::exchange(files_.failures.close, 0);
}

namespace {

constexpr int kFirstDescriptor = 3;

} // namespace

OpenFile FakeFiles::openForWriting(const std::string& path, ProtectionClass protection,
                                   int classOptions, unsigned mode) {
    calls_.push_back(base::concat("open ", path));
    if (std::exchange(failures.open, false)) {
        return {-1, path};
    }
    std::shared_ptr<FakeFile> file = disk_.find(path);
    if (!file) {
        file = disk_.make(path, mode);
        syncedNames_.erase(path);
    }
    if (!file) {
        return {-1, path};
    }
    protections_.insert_or_assign(path, Protection{protection, classOptions});
    const int descriptor = lowestFreeDescriptor();
    descriptors_.emplace(descriptor, std::move(file));
    return {descriptor, path};
}

std::unique_ptr<FileStream> FakeFiles::attachStream(const OpenFile& file) {
    calls_.emplace_back("attach");
    const auto found = descriptors_.find(file.descriptor);
    if (found == descriptors_.end() || std::exchange(failures.attach, false)) {
        return nullptr;
    }
    return std::make_unique<FakeFileStream>(*this, file.descriptor, found->second, file.path);
}

std::optional<std::vector<std::uint8_t>> FakeFiles::load(const std::string& path) {
    calls_.push_back(base::concat("load ", path));
    std::optional<FakeBytes> bytes = disk_.read(path);
    if (std::exchange(failures.load, false) || !bytes) {
        return std::nullopt;
    }
    bytes->resize(std::min(bytes->size(), kMaxLoadSize));
    return bytes;
}

std::optional<FakeFiles::Protection> FakeFiles::protectionOf(const std::string& path) const {
    const auto found = protections_.find(path);
    return found == protections_.end() ? std::nullopt : std::optional(found->second);
}

int FakeFiles::lowestFreeDescriptor() const {
    int descriptor = kFirstDescriptor;
    while (descriptors_.contains(descriptor)) {
        ++descriptor;
    }
    return descriptor;
}

int FakeFiles::sync(FakeFile& file, const std::string& path) {
    if (const int error = std::exchange(failures.sync, 0); error != 0) {
        return error;
    }
    file.syncedBytes = file.bytes;
    if (syncedNames_.insert(path).second) {
        file.nameSynced = true;
    }
    return 0;
}

} // namespace platform
