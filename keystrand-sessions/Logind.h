#pragma once

#include "base/NotCopied.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace keystrand::sessions {

/// Microseconds of CLOCK_MONOTONIC.
using MonotonicTime = std::uint64_t;

/// A session as logind has it.
struct Session {
    std::string id;
    /// Empty without a seat.
    std::string seat;
    /// "user", "greeter", "lock-screen", "background" and others.
    std::string sessionClass;
    /// "opening", "online", "active" or "closing".
    std::string state;
    bool isActive = false;
    bool isRemote = false;
    bool isHintSet = false;
    MonotonicTime created = 0;

    bool operator==(const Session&) const = default;
};

/// One process of logind.
struct LogindProcess {
    /// Its name on the bus, which no other process has as long as the bus lives.
    std::string uniqueName;
    /// When it was started; none where that cannot be found out.
    std::optional<MonotonicTime> started;

    bool operator==(const LogindProcess&) const = default;
};

/// What is told by a Logind, on the thread of the loop.
class LogindListener : private base::NotCopied {
  public:
    virtual ~LogindListener() = default;

    /// A logind is there, with these sessions and no others.
    virtual void isThere(const LogindProcess& process, const std::vector<Session>& sessions,
                         bool isPreparingForSleep) = 0;
    /// It is gone, or the bus is, and nothing can be said about sessions until `isThere`.
    virtual void isAway() = 0;
    /// A session is new, or is not as it was. A hint that is set and cleared again is told as two
    /// changes.
    virtual void sessionIs(const Session& session) = 0;
    virtual void sessionIsGone(const std::string& id) = 0;
    /// The machine goes to sleep when nobody delays it any more, or it has woken.
    virtual void prepareForSleep(bool isAboutTo) = 0;
};

/// The login manager of the machine.
///
/// It is looked for again and again while it is away, and nothing that happens meanwhile is lost:
/// `isThere` tells all there is.
class Logind : private base::NotCopied {
  public:
    virtual ~Logind() = default;

    /// Once. The listener outlives the logind, and is never called from within a call of its own.
    virtual void start(LogindListener& listener) = 0;

    /// Has sleep wait from now on, as long as logind lets anybody delay it, until `letSleep`. While
    /// that cannot be had, as when no logind is there, nothing delays it; where it was refused, a
    /// line says why. A delay ends with its logind and is then asked for anew.
    virtual void delaySleep() = 0;
    virtual void letSleep() = 0;
};

} // namespace keystrand::sessions
