#include "KSTLib/Platform.h"

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "common/Allocation.h"
#include "common/Failure.h"

#include <optional>
#include <pthread.h>

namespace kst {

namespace {

std::optional<LibraryPlatform> installed;
bool forksAreWatched = false;
std::uint64_t number = 0;

void startAnew() {
    closeChannel();
    gLogLevel = kInitialLogLevel;
}

/// Runs in the child before `fork` returns there, so it does only what a signal handler may.
void beginChild() {
    ++number;
    CallBuffer::wipeThoseOfOtherThreads();
    closeChannel();
    if (installed) {
        installed->registry.leaveToParent();
        installed->channel.leaveToParent();
    }
}

} // namespace

void installPlatform(const LibraryPlatform& platform) noexcept {
    installed.emplace(platform);
    installLog(&platform.log);
    startAnew();
    // The first call tries again.
    static_cast<void>(watchForks());
}

void removePlatform() noexcept {
    installed.reset();
    installLog(nullptr);
    startAnew();
}

void installLog(platform::SystemLog* log) noexcept {
    setLibraryLog(log);
}

const LibraryPlatform* installedPlatform() noexcept {
    return installed ? &*installed : nullptr;
}

bool watchForks() noexcept {
    // Nothing is done before a fork, which therefore never waits for a call of another thread.
    forksAreWatched = forksAreWatched || ::pthread_atfork(nullptr, nullptr, beginChild) == 0;
    return forksAreWatched;
}

void leaveInheritedToParent() noexcept {
    if (installed && (installed->channel.isInherited() || installed->registry.isInherited())) {
        beginChild();
    }
}

std::uint64_t processNumber() noexcept {
    return number;
}

} // namespace kst
