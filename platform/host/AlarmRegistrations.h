#pragma once

#include "platform/Date.h"

#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace platform {

/// The alarms that a process knows of: one date for each stream and event, and whether its event
/// was queued.
///
/// A registration that has fired stays until its event was handled, so that a process that ends in
/// between leaves an alarm that fires again.
class AlarmRegistrations {
  public:
    /// Stream and event.
    using Name = std::pair<std::string, std::string>;

    /// Registers the alarm, in the place of an earlier one, as one that has not fired.
    void put(const Name& name, Date date);

    /// The same unless there is one of this name.
    void putIfAbsent(const Name& name, Date date);

    void erase(const Name& name) { registrations_.erase(name); }

    /// Marks the alarms that are due as fired and returns them in the order of their dates.
    [[nodiscard]] std::vector<Name> takeDue(Date now);

    /// Marks the alarm as fired if it is registered for this very date and has not; whether that
    /// was so.
    [[nodiscard]] bool take(const Name& name, Date date);

    [[nodiscard]] bool hasFired(const Name& name) const;

    /// The date of the alarm that fires next.
    [[nodiscard]] std::optional<Date> next() const;

  private:
    struct Registration {
        Date date;
        bool fired = false;
    };

    std::map<Name, Registration> registrations_;
};

} // namespace platform
