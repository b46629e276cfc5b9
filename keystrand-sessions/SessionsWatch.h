#pragma once

#include "keystrand-sessions/KeystrandLink.h"
#include "keystrand-sessions/Logind.h"
#include "keystrand-sessions/SessionsLog.h"
#include "keystrand-sessions/SessionsModel.h"
#include "keystrand/Timers.h"

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace keystrand::sessions {

/// Tells keystrand whether the machine is locked and when it sleeps, from what logind tells.
///
/// Each connection is first told the state, as soon as that is known, and then whether the machine
/// goes to sleep or is awake; after that, what changes, also on the way to sleep. After waking it
/// is told the state and that the machine is awake, in this order: who acts on the second knows the
/// first. Sleep is delayed until keystrand has answered, for four seconds at the most, and not at
/// all while there is no connection. While logind is away the state stays, and after a minute it is
/// "locked".
class SessionsWatch : private LogindListener {
  public:
    static constexpr std::chrono::minutes kPatienceWithLogind{1};
    /// Less than the five seconds after which logind goes on by itself.
    static constexpr std::chrono::seconds kPatienceWithKeystrand{4};

    /// All that it is given outlives it.
    SessionsWatch(Logind& logind, KeystrandLink& keystrand, Timers& timers, SessionsLog log);

    /// Once.
    void start();

  private:
    void isThere(const LogindProcess& process, const std::vector<Session>& sessions,
                 bool isPreparingForSleep) override;
    void isAway() override;
    void sessionIs(const Session& session) override;
    void sessionIsGone(const std::string& id) override;
    void prepareForSleep(bool isAboutTo) override;

    void stateIsKnown();
    void sayAll();
    void sayState();
    void sayStateIfChanged();
    void goToSleep();
    void wake();
    void letSleep();

    Logind& logind_;
    KeystrandLink& keystrand_;
    SessionsLog log_;
    SessionsModel model_;
    /// Whether logind was there since the start, or its minute is over.
    bool isStateKnown_ = false;
    bool isLogindAway_ = false;
    bool isAboutToSleep_ = false;
    /// What keystrand was told last, if there was a connection.
    std::optional<bool> saidLocked_;
    std::unique_ptr<Timer> logindPatience_;
    std::unique_ptr<Timer> answerPatience_;
};

} // namespace keystrand::sessions
