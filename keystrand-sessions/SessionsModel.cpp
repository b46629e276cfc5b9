#include "keystrand-sessions/SessionsModel.h"

#include <algorithm>
#include <utility>

namespace keystrand::sessions {

namespace {

/// Whether it says anything about the seat that it is on.
bool counts(const Session& session) {
    return session.isActive && !session.seat.empty() && !session.isRemote &&
           session.sessionClass == "user" && session.state != "closing";
}

} // namespace

bool SessionsModel::isLocked() const {
    return wasAwayTooLong_ ||
           std::none_of(sessions_.begin(), sessions_.end(), [](const auto& entry) {
               return counts(entry.second.session) && entry.second.isUnlocked();
           });
}

void SessionsModel::logindIs(const LogindProcess& process, const std::vector<Session>& sessions) {
    // Two that did not say when they started may be two, whatever their names are.
    const bool isSame = process_ == process && process.started;
    process_ = process;
    wasAwayTooLong_ = false;
    const auto before = std::exchange(sessions_, {});
    for (const Session& session : sessions) {
        const auto found = before.find(session.id);
        const Known* const known =
            found != before.end() && found->second.session.created == session.created
                ? &found->second
                : nullptr;
        // On another logind a hint that was set is forgotten, and one that was clear still is.
        const bool isHintKnown =
            known != nullptr && (isSame ? known->isHintKnown : known->isUnlocked());
        const bool isNew = process.started && session.created > *process.started;
        put(session, isHintKnown || isNew);
    }
}

void SessionsModel::logindWasAwayTooLong() {
    wasAwayTooLong_ = true;
    for (auto& [id, known] : sessions_) {
        known.isHintKnown = false;
    }
}

void SessionsModel::sessionIs(const Session& session) {
    const auto found = sessions_.find(session.id);
    if (found != sessions_.end() && found->second.session.created == session.created) {
        put(session, found->second.isHintKnown);
        return;
    }
    // All that were there when logind was found are known.
    put(session, !process_ || !process_->started || session.created > *process_->started);
}

void SessionsModel::put(const Session& session, bool isHintKnown) {
    sessions_[session.id] = {session, isHintKnown || session.isHintSet};
}

} // namespace keystrand::sessions
