#include "platform/fake/FakeFileStream.h"

#include "base/Concat.h"
#include "platform/fake/FakeFiles.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform {

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

} // namespace platform
