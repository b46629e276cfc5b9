#pragma once

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "common/CommandSender.h"

/// How the library's own functions send their commands.
namespace kst {

[[nodiscard]] inline CommandSender librarySender() noexcept {
    return {libraryContext(), channelTransport};
}

/// `init`, with a failure reported by the caller's line too.
[[nodiscard]] inline KSTStatus openChannel(CheckPlace place = CheckPlace::here()) noexcept {
    const KSTStatus err = init();
    return err == kKSTErrorSuccess ? err : failCall(libraryContext(), err, place);
}

/// `updateLogLevel`, unless there is no connection to ask over, or the call that failed ended it.
inline void updateLogLevelIfOpen() noexcept {
    if (gChannelOpen && !isConnectionLost()) {
        updateLogLevel();
    }
}

} // namespace kst
