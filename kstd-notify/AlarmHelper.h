#pragma once

#include "base/FileDescriptor.h"
#include "kstd-notify/AlarmTimer.h"
#include "platform/Clock.h"
#include "platform/linux/alarms/AlarmStore.h"

#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace notify {

/// Makes the init system's timer for the daemon, which has no way to the init system: the timer
/// waits for the earliest alarm on disk that is not due.
///
/// Datagrams on a socket say that the alarms have changed. They count when root sends them, or who
/// runs this process. What is in them does not matter; a socket that comes along is told what
/// became of the timer (wire/AlarmAnswer.h). What is due is fired by the daemon that asked; when
/// there is none any more, the timer's service is started at once.
class AlarmHelper {
  public:
    /// `socket` may be closed. Everything else outlives this. Messages go to `errors`.
    AlarmHelper(base::FileDescriptor socket, platform::AlarmStore& store, AlarmTimerUnit& unit,
                AlarmTimer& timer, platform::Clock& clock, std::ostream& errors);

    /// Brings the timer up to date, also when nobody asks: an earlier process may have ended over
    /// it. Then as long as something is in the socket's queue; does not wait for more. False when
    /// it has failed at last and nobody was told.
    [[nodiscard]] bool run();

  private:
    struct Alarms {
        bool areDue = false;
        /// The earliest of the others.
        std::optional<platform::Date> next{};
    };
    struct Question {
        bool counts = false;
        /// Where to answer.
        base::FileDescriptor answers{};
    };

    [[nodiscard]] bool bringUpToDate(const std::vector<Question>& questions);
    [[nodiscard]] Alarms alarms();
    void report(const std::string& reason);
    [[nodiscard]] std::vector<Question> takeQuestions();
    [[nodiscard]] std::optional<Question> receive();

    base::FileDescriptor socket_;
    platform::AlarmStore& store_;
    AlarmTimerUnit& unit_;
    AlarmTimer& timer_;
    platform::Clock& clock_;
    std::ostream& errors_;
};

/// The socket that the init system has handed to this process under the name "alarms", or none.
[[nodiscard]] base::FileDescriptor takeActivatedAlarmSocket();

} // namespace notify
