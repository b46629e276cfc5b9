#include "platform/linux/LinuxAlarm.h"

#include "base/ByteReader.h"
#include "platform/linux/RealTime.h"

#include <algorithm>

namespace platform {

namespace {

constexpr char kArmedLabel[] = "alarm armed";

std::optional<Date> dateIn(const EventDictionary* dictionary) {
    if (dictionary == nullptr) {
        return std::nullopt;
    }
    const auto date = dictionary->find(kAlarmDateKey);
    return date == dictionary->end() ? std::nullopt : std::optional(date->second);
}

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
    events_.drop(stream, event);
    if (const std::optional<Date> date = dateIn(dictionary)) {
        const auto found = registrations_.find(name);
        const bool isKept =
            found != registrations_.end() && found->second.kept && found->second.date == *date;
        registrations_.insert_or_assign(
            name, Registration{*date, isKept || store_.save(stream, event, *date)});
        fireDue();
    } else {
        cancel(name);
    }
    armForNext();
}

void LinuxAlarm::cancel(const Name& name) {
    // A copy, because the name may be the one inside the registration.
    const Name cancelled = name;
    if (registrations_.erase(cancelled) > 0) {
        store_.clear(cancelled.first, cancelled.second);
    }
}

bool LinuxAlarm::arrived(std::string_view stream, std::string_view event,
                         std::span<const std::uint8_t> payload) {
    base::ByteReader reader(payload);
    std::uint64_t date = 0;
    if (!reader.readU64(date) || reader.left() != 0) {
        return false;
    }
    const auto found = registrations_.find(Name(stream, event));
    if (found != registrations_.end() && !found->second.fired &&
        found->second.date.nanosecondsSince1970 == static_cast<std::int64_t>(date)) {
        fire(found->first, found->second);
        armForNext();
    }
    return true;
}

void LinuxAlarm::close() {
    source_.reset();
    armed_.reset();
}

void LinuxAlarm::restore(std::string_view stream) {
    for (auto& [event, date] : store_.load(stream)) {
        registrations_.try_emplace(Name(stream, event), Registration{date, true});
    }
    fireDue();
    armForNext();
}

/// A registration that has fired ends when its event was handled and it was not replaced meanwhile,
/// so that a process killed in between leaves an alarm that fires again.
void LinuxAlarm::delivered(const Event& event) {
    const auto found = registrations_.find(Name(event.stream, event.name));
    if (found != registrations_.end() && found->second.fired &&
        !events_.holds(event.stream, event.name)) {
        cancel(found->first);
    }
}

void LinuxAlarm::timerWoke() {
    if (timer_.acknowledge() != RealTimeTimer::Wake::nothing) {
        fireDue();
        armForNext();
    }
}

/// In the order of their dates.
void LinuxAlarm::fireDue() {
    const Date now = realTimeNow();
    for (auto next = earliest(); next != registrations_.end() && next->second.date <= now;
         next = earliest()) {
        fire(next->first, next->second);
    }
}

/// The alarm that fires next, of those that have not fired.
LinuxAlarm::Registrations::iterator LinuxAlarm::earliest() {
    auto earliest = registrations_.end();
    for (auto it = registrations_.begin(); it != registrations_.end(); ++it) {
        const bool isEarlier =
            earliest == registrations_.end() || it->second.date < earliest->second.date;
        if (!it->second.fired && isEarlier) {
            earliest = it;
        }
    }
    return earliest;
}

void LinuxAlarm::fire(const Name& name, Registration& registration) {
    registration.fired = true;
    events_.post({name.first, name.second});
}

void LinuxAlarm::armForNext() {
    if (!source_) {
        return;
    }
    const auto next = earliest();
    source_->setEnabled(next != registrations_.end());
    if (next != registrations_.end()) {
        timer_.arm(next->second.date);
        if (!armed_) {
            armed_.emplace(transactions_, kArmedLabel);
        }
    } else if (armed_) {
        timer_.disarm();
        armed_.reset();
    }
}

} // namespace platform
