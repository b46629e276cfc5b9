#include "platform/fake/FakeFiles.h"

#include "base/Concat.h"
#include "platform/fake/FakeFileStream.h"

#include <utility>

namespace platform {

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
    if (std::exchange(failures.load, false) || !bytes || bytes->size() > kMaxLoadSize) {
        return std::nullopt;
    }
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
