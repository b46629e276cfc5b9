#pragma once

#include "keystrand-sessions/Logind.h"

#include <string>
#include <utility>

namespace keystrand::sessions {

/// Somebody who sits in front of the machine and has not locked the screen.
inline Session userSession(std::string id, MonotonicTime created) {
    Session session;
    session.id = std::move(id);
    session.seat = "seat0";
    session.sessionClass = "user";
    session.state = "active";
    session.isActive = true;
    session.created = created;
    return session;
}

inline Session locked(Session session) {
    session.isHintSet = true;
    return session;
}

/// The same session when another one is in front.
inline Session behind(Session session) {
    session.isActive = false;
    session.state = "online";
    return session;
}

} // namespace keystrand::sessions
