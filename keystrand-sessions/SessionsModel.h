#pragma once

#include "keystrand-sessions/Logind.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace keystrand::sessions {

/// Whether the machine is locked, from what logind says about its sessions.
///
/// Of each seat the active session counts, if it is a user's, is not remote and is not closing: the
/// seat is locked when its hint is set. A seat with a greeter or nobody is locked. The machine is
/// unlocked while at least one seat is: somebody is there. A user who works at one seat need not
/// log in at the others, too, to have the machine unlocked.
///
/// Text consoles have no lock, and so nobody sets the hint of a session on one: it is unlocked
/// until it is left or another one is active.
///
/// A hint that is clear means something only where it is known not to have been forgotten, as
/// logind forgets every hint when it starts. That is so for a session that began after its logind
/// did, and for one whose hint was seen set on it. Any other is as it was seen on the logind
/// before, and locked if it was not seen there.
class SessionsModel {
  public:
    [[nodiscard]] bool isLocked() const;

    /// A logind is there, the same one as before or another, with just these sessions.
    void logindIs(const LogindProcess& process, const std::vector<Session>& sessions);
    /// What was known holds as long as nothing else is said.
    void logindWasAwayTooLong();

    void sessionIs(const Session& session);
    void sessionIsGone(const std::string& id) { sessions_.erase(id); }

  private:
    struct Known {
        Session session;
        /// Whether a clear hint says that it is unlocked.
        bool isHintKnown = false;

        [[nodiscard]] bool isUnlocked() const { return isHintKnown && !session.isHintSet; }
    };

    void put(const Session& session, bool isHintKnown);

    std::optional<LogindProcess> process_;
    std::map<std::string, Known> sessions_;
    bool wasAwayTooLong_ = false;
};

} // namespace keystrand::sessions
