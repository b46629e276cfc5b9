#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "kstd/LogLines.h"
#include "platform/Files.h"

namespace kstd {

namespace {

constexpr char kSaveDataBlob[] = "-[DeviceRestrictedModeService saveDataBlob:data:]";
constexpr char kLoadDataBlob[] = "-[DeviceRestrictedModeService loadDataBlob:]";

constexpr unsigned kOwnerReadWrite = 0600;

/// Writes the blob through a stream of the file and syncs and closes it. A failure has written its
/// assertion line.
bool writeBlob(platform::Files& files, const platform::OpenFile& opened,
               std::span<const std::uint8_t> data, const kst::AssertionContext& assertions) {
    const auto file = files.attachStream(opened);
    if (!file) {
        kst::fail(assertions, "file", 0, kKSTErrorUnexpected);
        return false;
    }
    bool failed = true;
    if (file->write(data.data(), 1, data.size()) != data.size()) {
        kst::fail(assertions, "written == data.length", 0, kKSTErrorUnexpected);
    } else if (const int syncError = file->fullSync(); syncError != 0) {
        kst::fail(assertions, "ferr == 0 ", syncError, kKSTErrorUnexpected);
    } else if (const int closeError = file->close(); closeError != 0) {
        kst::fail(assertions, "ferr == 0 ", closeError, kKSTErrorUnexpected);
    } else {
        failed = false;
    }
    if (failed) {
        // Also after a failed close: the one failure path closes whatever happened before.
        file->close();
    }
    return !failed;
}

} // namespace

KSTStatus DeviceRestrictedModeService::saveDataBlob(const std::string& path,
                                                    std::span<const std::uint8_t> data) {
    logLine(host().log, kSaveDataBlob, "called, filePath = ", path, ".");
    const platform::OpenFile opened = host().files.openForWriting(
        path, platform::ProtectionClass::none, platform::kNoClassOptions, kOwnerReadWrite);
    if (opened.descriptor < 0) {
        kst::fail(assertions(), "fd >= 0", 0, kKSTErrorUnexpected);
    } else if (writeBlob(host().files, opened, data, assertions())) {
        return kKSTErrorSuccess;
    }
    logLine(host().log, kSaveDataBlob, "returning, err = ", KSTStatus{kKSTErrorUnexpected}, ".");
    return kKSTErrorUnexpected;
}

std::optional<std::vector<std::uint8_t>>
DeviceRestrictedModeService::loadDataBlob(const std::string& path) {
    logLine(host().log, kLoadDataBlob, "called, filePath = ", path, ".");
    return host().files.load(path);
}

} // namespace kstd
