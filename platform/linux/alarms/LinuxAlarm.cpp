#include "platform/linux/alarms/LinuxAlarm.h"

#include "base/ByteReader.h"
#include "platform/linux/LinuxClock.h"

namespace platform {

LinuxAlarm::LinuxAlarm(LinuxEventStream& events, AlarmStore store, AlarmWaker& waker)
    : events_(events), store_(std::move(store)), waker_(waker) {
    events_.setHandlerObserver([this](std::string_view stream) { restore(stream); });
    events_.addDeliveryObserver([this](const Event& event) { delivered(event); });
}

void LinuxAlarm::set(std::string_view stream, std::string_view event,
                     const EventDictionary* dictionary) {
    const Name name(stream, event);
    restore(stream);
    // What the earlier registration has queued would be taken for this one's.
    events_.drop(stream, event);
    if (const auto date = alarmDateIn(dictionary)) {
        save(name, *date);
        registrations_.put(name, *date);
    } else {
        cancel(name);
    }
    fireDueAndArm();
}

void LinuxAlarm::save(const Name& name, Date date) {
    if (store_.save(name.first, name.second, date)) {
        unsaved_.erase(name);
        return;
    }
    unsaved_.insert_or_assign(name, date);
    if (isClosed_) {
        store_.reportLost(name.first, name.second);
    }
}

void LinuxAlarm::saveUnsaved() {
    // A copy, because what gets onto disk is taken out.
    for (const auto& [name, date] : std::map(unsaved_)) {
        save(name, date);
    }
}

void LinuxAlarm::tryAgain() {
    const std::size_t unsaved = unsaved_.size();
    saveUnsaved();
    if (unsaved_.size() == unsaved) {
        waker_.tryAgain();
        return;
    }
    // What the waker looks at may have been the earlier state of the disk.
    knowsWhatIsArmed_ = false;
    fireDueAndArm();
}

void LinuxAlarm::close() {
    isClosed_ = true;
    saveUnsaved();
    waker_.close();
}

void LinuxAlarm::cancel(const Name& name) {
    store_.clear(name.first, name.second);
    unsaved_.erase(name);
    registrations_.erase(name);
}

bool LinuxAlarm::arrived(std::string_view stream, std::string_view event,
                         std::span<const std::uint8_t> payload) {
    base::ByteReader reader(payload);
    std::uint64_t date = 0;
    if (!reader.readU64(date) || reader.left() != 0) {
        return false;
    }
    const Name name(stream, event);
    if (registrations_.take(name, {static_cast<std::int64_t>(date)})) {
        events_.post({name.first, name.second});
    }
    woke();
    return true;
}

void LinuxAlarm::woke() {
    knowsWhatIsArmed_ = false;
    fireDueAndArm();
}

void LinuxAlarm::restore(std::string_view stream) {
    if (!restored_.emplace(stream).second) {
        return;
    }
    for (const auto& [event, date] : store_.load(stream)) {
        registrations_.putIfAbsent(Name(stream, event), date);
    }
    fireDueAndArm();
}

void LinuxAlarm::delivered(const Event& event) {
    const Name name(event.stream, event.name);
    // With another of its name in the queue the alarm is still in hand.
    if (registrations_.hasFired(name) && !events_.holds(event.stream, event.name)) {
        cancel(name);
    }
}

void LinuxAlarm::fireDueAndArm() {
    for (const auto& [stream, event] : registrations_.takeDue(realTimeNow())) {
        events_.post({stream, event});
    }
    const std::optional<Date> next = registrations_.next();
    // A process that waits itself would rather not: whatever happens is an opportunity.
    if (knowsWhatIsArmed_ && armedFor_ == next && !waker_.holdsProcess()) {
        return;
    }
    armedFor_ = next;
    knowsWhatIsArmed_ = true;
    if (next) {
        waker_.arm(*next);
    } else {
        waker_.disarm();
    }
}

} // namespace platform
