#pragma once

#include "platform/EventStream.h"
#include "platform/ProcessTransaction.h"
#include "platform/linux/AlarmStore.h"
#include "platform/linux/LinuxEventStream.h"
#include "platform/linux/LinuxRunLoop.h"
#include "platform/linux/RealTimeTimer.h"
#include "platform/shared/AlarmRegistrations.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

/// AlarmEvent with registrations on disk and a timer in the process.
///
/// A stream's registrations are read back when the stream gets its handler, or its first alarm:
/// what became due while no process ran is then delivered at once. The timer cannot launch a
/// process that is gone, so while an alarm is armed a transaction keeps this one from ending for
/// being idle.
class LinuxAlarm final : public AlarmEvent {
  public:
    LinuxAlarm(LinuxEventStream& events, LinuxRunLoop& loop, AlarmStore store,
               ProcessTransactions& transactions);

    void set(std::string_view stream, std::string_view event,
             const EventDictionary* dictionary) override;

    /// An alarm event that came in from outside the process, with the date it was fired for as its
    /// payload. One that is not for the present registration is dropped; false when the payload is
    /// no date.
    bool arrived(std::string_view stream, std::string_view event,
                 std::span<const std::uint8_t> payload);

    /// Waits for no alarm any more; the registrations stay.
    void close();

  private:
    using Name = AlarmRegistrations::Name;

    void restore(std::string_view stream);
    void delivered(const Event& event);
    void cancel(const Name& name);
    void timerWoke();
    void fireDueAndArm();
    void armForNext();

    LinuxEventStream& events_;
    AlarmStore store_;
    ProcessTransactions& transactions_;
    RealTimeTimer timer_;
    std::unique_ptr<RunLoopSource> source_;
    AlarmRegistrations registrations_;
    /// The streams whose registrations were read back.
    std::set<std::string, std::less<>> restored_;
    std::optional<ProcessTransaction> armed_;
};

} // namespace platform
