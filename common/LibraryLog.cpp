#include "common/LibraryLog.h"

namespace kst {

namespace {

platform::SystemLog* installedLog = nullptr;

} // namespace

platform::SystemLog* libraryLog() noexcept {
    return installedLog;
}

void setLibraryLog(platform::SystemLog* log) noexcept {
    installedLog = log;
}

} // namespace kst
