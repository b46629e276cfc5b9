#include "KSTLib/Platform.h"

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "common/LibraryLog.h"

#include <optional>

namespace kst {

namespace {

std::optional<LibraryPlatform> installed;

void startAnew() {
    gChannelOpen = false;
    gConnection = platform::kNoConnection;
    gLogLevel = kInitialLogLevel;
}

} // namespace

void installPlatform(const LibraryPlatform& platform) noexcept {
    installed.emplace(platform);
    setLibraryLog(&platform.log);
    startAnew();
}

void removePlatform() noexcept {
    installed.reset();
    setLibraryLog(nullptr);
    startAnew();
}

const LibraryPlatform* installedPlatform() noexcept {
    return installed ? &*installed : nullptr;
}

} // namespace kst
