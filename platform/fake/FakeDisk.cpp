#include "platform/fake/FakeDisk.h"

#include "platform/fake/FakeFormats.h"

#include <algorithm>

namespace platform {

namespace {

std::string_view directoryOf(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    return slash == 0 || slash == std::string_view::npos ? "/" : path.substr(0, slash);
}

} // namespace

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
    if (!isDirectory(directoryOf(path)) || isDirectory(path)) {
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

} // namespace platform
