#pragma once

#include "base/NotCopied.h"
#include "keystrand-sessions/Logind.h"

#include <functional>
#include <optional>
#include <string>

namespace keystrand::sessions {

/// A machine with a logind: what happens there, for the tests of whoever listens to it. At first no
/// logind runs.
class LogindMachine : private base::NotCopied {
  public:
    virtual ~LogindMachine() = default;

    /// The one that is listened to.
    [[nodiscard]] virtual Logind& logind() = 0;

    /// Another process of it, which has forgotten every hint, and says when it was started or not.
    virtual void startLogind(std::optional<MonotonicTime> started) = 0;
    virtual void stopLogind() = 0;
    /// The bus goes, and logind with it.
    virtual void stopBus() = 0;
    virtual void startBus() = 0;

    /// A session is new, or is otherwise than it was.
    virtual void put(const Session& session) = 0;
    virtual void remove(const std::string& id) = 0;
    virtual void prepareForSleep(bool isAboutTo) = 0;

    [[nodiscard]] virtual bool isSleepDelayed() = 0;

    /// Lets things happen until that is so. False when it does not become so.
    [[nodiscard]] virtual bool happenUntil(const std::function<bool()>& isSo) = 0;
};

} // namespace keystrand::sessions
