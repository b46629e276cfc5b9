#include "platform/linux/LinuxAlarm.h"

#include "base/ByteReader.h"
#include "platform/linux/RealTime.h"

namespace platform {

namespace {

constexpr char kArmedLabel[] = "alarm armed";

} // namespace

LinuxAlarm::LinuxAlarm(LinuxEventStream& events, LinuxRunLoop& loop, AlarmStore store,
                       ProcessTransactions& transactions)
    : events_(events),
      store_(std::move(store)),
      transactions_(transactions),
      source_(loop.addReadable(timer_.descriptor(), [this] { timerWoke(); })) {
    source_->setEnabled(false);
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
        armForNext();
    }
    return true;
}

void LinuxAlarm::close() {
    source_.reset();
    armed_.reset();
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

void LinuxAlarm::timerWoke() {
    if (timer_.acknowledge() != RealTimeTimer::Wake::nothing) {
        fireDueAndArm();
    }
}

void LinuxAlarm::fireDueAndArm() {
    for (const auto& [stream, event] : registrations_.takeDue(realTimeNow())) {
        events_.post({stream, event});
    }
    armForNext();
}

void LinuxAlarm::armForNext() {
    if (!source_) {
        return;
    }
    const std::optional<Date> next = registrations_.next();
    source_->setEnabled(next.has_value());
    if (next) {
        timer_.arm(*next);
        if (!armed_) {
            armed_.emplace(transactions_, kArmedLabel);
        }
    } else if (armed_) {
        timer_.disarm();
        armed_.reset();
    }
}

} // namespace platform
