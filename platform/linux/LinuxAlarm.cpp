#include "platform/linux/LinuxAlarm.h"

#include "base/ByteReader.h"
#include "platform/linux/RealTime.h"

namespace platform {

LinuxAlarm::LinuxAlarm(LinuxEventStream& events, AlarmStore store, AlarmWaker& waker)
    : events_(events), store_(std::move(store)), waker_(waker) {
    events_.setHandlerObserver([this](std::string_view stream) { restore(stream); });
    events_.setDeliveryObserver([this](const Event& event) { delivered(event); });
}

void LinuxAlarm::set(std::string_view stream, std::string_view event,
                     const EventDictionary* dictionary) {
    const Name name(stream, event);
    restore(stream);
    events_.drop(stream, event);
    if (const auto date = alarmDateIn(dictionary)) {
        store_.save(stream, event, *date);
        registrations_.put(name, *date);
    } else {
        cancel(name);
    }
    fireDueAndArm();
}

void LinuxAlarm::cancel(const Name& name) {
    store_.clear(name.first, name.second);
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
    if (registrations_.hasFired(name) && !events_.holds(event.stream, event.name)) {
        cancel(name);
    }
}

void LinuxAlarm::fireDueAndArm() {
    do {
        for (const auto& [stream, event] : registrations_.takeDue(realTimeNow())) {
            events_.post({stream, event});
        }
    } while (!armForNext());
}

/// False when the next alarm became due before it was armed.
bool LinuxAlarm::armForNext() {
    const std::optional<Date> next = registrations_.next();
    if (knowsWhatIsArmed_ && armedFor_ == next) {
        return true;
    }
    knowsWhatIsArmed_ = false;
    if (next && !waker_.arm(*next)) {
        return false;
    }
    if (!next) {
        waker_.disarm();
    }
    armedFor_ = next;
    knowsWhatIsArmed_ = true;
    return true;
}

} // namespace platform
