#include "platform/linux/LinuxSystemVersion.h"

#include "platform/linux/OsReleaseText.h"
#include "platform/linux/RegularFile.h"

#include <utility>

namespace platform {

namespace {

std::string osRelease(const Paths& paths) {
    RegularFile file = readRegularFile(paths.osRelease(), LinuxSystemVersion::kMaxSize);
    if (file.failure != ReadFailure::none) {
        file = readRegularFile(paths.vendorOsRelease(), LinuxSystemVersion::kMaxSize);
    }
    return {file.bytes.begin(), file.bytes.end()};
}

/// The value, unless there is none or it is empty.
std::optional<std::string> known(std::string_view text, std::string_view name) {
    std::optional<std::string> value = valueInOsRelease(text, name);
    return value && !value->empty() ? value : std::nullopt;
}

} // namespace

LinuxSystemVersion::LinuxSystemVersion(Paths paths) : paths_(std::move(paths)) {}

std::optional<std::string> LinuxSystemVersion::build() {
    const std::string text = osRelease(paths_);
    std::optional<std::string> build = known(text, "BUILD_ID");
    return build ? build : known(text, "VERSION_ID");
}

std::optional<std::string> LinuxSystemVersion::product() {
    return known(osRelease(paths_), "NAME");
}

} // namespace platform
