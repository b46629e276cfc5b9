#include "keystrand-sessions/SessionsWatch.h"

#include "base/Concat.h"

#include <utility>

namespace keystrand::sessions {

SessionsWatch::SessionsWatch(Logind& logind, KeystrandLink& keystrand, Timers& timers,
                             SessionsLog log)
    : logind_(logind),
      keystrand_(keystrand),
      log_(std::move(log)),
      logindPatience_(timers.timer([this] {
          log_(SessionsLine::logindAway,
               "logind was away for a minute; the machine counts as locked.");
          model_.logindWasAwayTooLong();
          stateIsKnown();
      })),
      answerPatience_(timers.timer([this] {
          log_(SessionsLine::asleepUntold,
               "keystrand does not answer; the machine goes to sleep without it.");
          letSleep();
      })) {}

void SessionsWatch::start() {
    keystrand_.start({[this] { sayAll(); }, [this] { letSleep(); },
                      [this] {
                          letSleep();
                      }});
    logind_.start(*this);
    logind_.delaySleep();
    logindPatience_->startFor(kPatienceWithLogind);
}

void SessionsWatch::isThere(const LogindProcess& process, const std::vector<Session>& sessions,
                            bool isPreparingForSleep) {
    logindPatience_->stop();
    model_.logindIs(process, sessions);
    stateIsKnown();
    prepareForSleep(isPreparingForSleep);
    if (std::exchange(isLogindAway_, false)) {
        log_(SessionsLine::logindBack, "logind is back.");
    }
}

void SessionsWatch::stateIsKnown() {
    if (!std::exchange(isStateKnown_, true)) {
        sayAll();
    } else {
        sayStateIfChanged();
    }
}

void SessionsWatch::isAway() {
    isLogindAway_ = true;
    logindPatience_->startFor(kPatienceWithLogind);
    log_(SessionsLine::logindAway,
         base::concat("logind is away; the machine stays ",
                      model_.isLocked() ? "locked"
                                        : "unlocked until it is back, for a minute at the most",
                      "."));
}

void SessionsWatch::sessionIs(const Session& session) {
    model_.sessionIs(session);
    sayStateIfChanged();
}

void SessionsWatch::sessionIsGone(const std::string& id) {
    model_.sessionIsGone(id);
    sayStateIfChanged();
}

void SessionsWatch::prepareForSleep(bool isAboutTo) {
    if (isAboutTo != std::exchange(isAboutToSleep_, isAboutTo)) {
        isAboutTo ? goToSleep() : wake();
    }
}

void SessionsWatch::goToSleep() {
    if (!keystrand_.isConnected()) {
        log_(SessionsLine::asleepUntold,
             "the machine goes to sleep, and keystrand is not there to be told.");
        letSleep();
        return;
    }
    keystrand_.say(Word::goingToSleep);
    answerPatience_->startFor(kPatienceWithKeystrand);
}

void SessionsWatch::wake() {
    answerPatience_->stop();
    logind_.delaySleep();
    sayAll();
}

void SessionsWatch::letSleep() {
    answerPatience_->stop();
    if (isAboutToSleep_) {
        logind_.letSleep();
    }
}

void SessionsWatch::sayAll() {
    if (isStateKnown_) {
        sayState();
        keystrand_.say(isAboutToSleep_ ? Word::goingToSleep : Word::awake);
    }
}

void SessionsWatch::sayState() {
    saidLocked_ = model_.isLocked();
    keystrand_.say(*saidLocked_ ? Word::locked : Word::unlocked);
}

void SessionsWatch::sayStateIfChanged() {
    if (saidLocked_ != model_.isLocked()) {
        sayState();
    }
}

} // namespace keystrand::sessions
