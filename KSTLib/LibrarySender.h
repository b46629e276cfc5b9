#pragma once

#include "KSTLib/Channel.h"
#include "KSTLib/Contexts.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Status.h"
#include "base/NotCopied.h"
#include "common/CommandSender.h"
#include "common/Failure.h"

#include <cstdint>

/// How the library's own functions send their commands, and the context that some make for one
/// call.
namespace kst {

/// To be used behind `openChannel`.
[[nodiscard]] inline CommandSender librarySender() noexcept {
    return {libraryContext(), openChannelTransport};
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

/// KSTContextCreate and KSTContextDelete as parts of another function's call, in whose time they
/// are.
[[nodiscard]] KSTStatus createContext(KSTContextRef* context) noexcept;
[[nodiscard]] KSTStatus deleteContext(KSTContextRef context, bool destroy) noexcept;

/// `deleteContext` that tells the kernel service and does not wait for its answer.
[[nodiscard]] KSTStatus postContextDelete(KSTContextRef context) noexcept;

/// A context that is made for one call on the global scope and destroyed at the end of the scope:
/// also when the call's time is up, but then nobody waits for the kernel service's answer. When it
/// cannot be told, and in a child that a block of the call forked, the object goes alone.
class TemporaryContext : private base::NotCopied {
  public:
    ~TemporaryContext();

    /// What KSTContextCreate fails with, reported by the caller's line too. To be called once.
    [[nodiscard]] KSTStatus create(CheckPlace place = CheckPlace::here()) noexcept;

    [[nodiscard]] KSTContextRef get() const { return context_; }

  private:
    KSTContextRef context_ = nullptr;
    std::uint64_t process_ = 0;
};

} // namespace kst
