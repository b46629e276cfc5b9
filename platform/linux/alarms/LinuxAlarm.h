#pragma once

#include "platform/EventStream.h"
#include "platform/host/AlarmRegistrations.h"
#include "platform/linux/LinuxEventStream.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "platform/linux/alarms/AlarmWaker.h"

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

/// AlarmEvent with registrations on disk and something that wakes.
///
/// A stream's registrations are read back when the stream gets its handler, or its first alarm:
/// what became due while no process ran is then delivered at once.
class LinuxAlarm final : public AlarmEvent {
  public:
    LinuxAlarm(LinuxEventStream& events, AlarmStore store, AlarmWaker& waker);

    void set(std::string_view stream, std::string_view event,
             const EventDictionary* dictionary) override;

    /// An alarm event that came in from outside the process, with the date it was fired for as its
    /// payload. One that is not for the present registration is dropped; false when the payload is
    /// no date. Whatever it was for, what is registered is armed again: the timer that had the
    /// event sent is gone.
    bool arrived(std::string_view stream, std::string_view event,
                 std::span<const std::uint8_t> payload);

    /// The waker woke this process: what is due fires, and the rest is armed again.
    void woke();

    /// Whether an alarm is lost, or late, to a process that ends now: the date is not on disk, or
    /// nothing but this process waits for it.
    [[nodiscard]] bool holdsProcess() const { return !unsaved_.empty() || waker_.holdsProcess(); }

    /// An idle time has passed: what has failed is tried again.
    void tryAgain();

    /// This process is woken no more; the registrations stay. An alarm that does not get onto disk
    /// now, or that is set afterwards and does not, is lost, with a line.
    void close();

  private:
    using Name = AlarmRegistrations::Name;

    void restore(std::string_view stream);
    void save(const Name& name, Date date);
    void saveUnsaved();
    void delivered(const Event& event);
    void cancel(const Name& name);
    void fireDueAndArm();

    LinuxEventStream& events_;
    AlarmStore store_;
    AlarmWaker& waker_;
    AlarmRegistrations registrations_;
    /// The streams whose registrations were read back.
    std::set<std::string, std::less<>> restored_;
    /// What is not on disk.
    std::map<Name, Date> unsaved_;
    /// What the waker waits for, as far as this process knows.
    std::optional<Date> armedFor_;
    bool knowsWhatIsArmed_ = true;
    bool isClosed_ = false;
};

} // namespace platform
