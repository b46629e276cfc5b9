#pragma once

#include "base/FileDescriptor.h"
#include "platform/SystemLog.h"
#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/alarms/AlarmWaker.h"
#include "wire/AlarmAnswer.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// AlarmWaker with a timer of the init system, which launches a daemon that has ended. The timer is
/// made by a helper: this process has no way to the init system.
///
/// The helper is told by a datagram, which its socket keeps until one runs, that the registrations
/// on disk have changed. It is sent the one end of a pair of sockets along, and answers there; that
/// the other end is open tells it that somebody is there to fire what is due. Until it has said
/// that the timer waits for the very date that is armed, another waker waits for that date as well,
/// and holds the process. Nobody waits for the answer.
class HelpedAlarmWaker final : public AlarmWaker {
  public:
    /// How long the helper may take before a line says that this process waits itself.
    static constexpr std::chrono::seconds kPatience{5};

    /// `helperSocket` is the file of the helper's socket. The other waker must be able to arm any
    /// date. All of them outlive this one.
    HelpedAlarmWaker(std::string helperSocket, LinuxRunLoop& loop, AlarmWaker& inProcess,
                     SystemLog& log, std::chrono::microseconds patience = kPatience);

    /// Asks the helper, whatever it was asked or has said before. After `close` it is still told of
    /// the change.
    void arm(Date date) override;
    /// Tells the helper, whose answer does not matter: a timer that stays finds nothing to send
    /// when it elapses.
    void disarm() override;
    [[nodiscard]] bool holdsProcess() const override { return inProcess_.holdsProcess(); }
    /// Asks the helper again when it has not confirmed the timer within its time.
    void tryAgain() override;
    void close() override;

  private:
    void ask();
    void awaitAnswer(base::FileDescriptor answers);
    void dropQuestion();
    void answerArrived();
    void take(const wire::AlarmAnswer& answer);
    void settle();
    void patienceIsOver();
    void sayThatItDoesNotWake();

    std::string helperSocket_;
    LinuxRunLoop& loop_;
    AlarmWaker& inProcess_;
    SystemLog& log_;
    std::chrono::microseconds patience_;
    /// What the timer is to wait for, as long as the helper has not said that it does.
    std::optional<Date> unconfirmed_;
    /// Where the helper answers.
    base::FileDescriptor answers_;
    std::unique_ptr<RunLoopSource> answersSource_;
    std::unique_ptr<RunLoopSource> timer_;
    bool isTimerRunning_ = false;
    /// Why there is no timer, as far as is known.
    std::string problem_;
    bool saidThatItWaits_ = false;
    bool saidThatItDoesNotWake_ = false;
};

} // namespace platform
