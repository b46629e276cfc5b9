#pragma once

#include "platform/Date.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace platform {

/// The alarm registrations of a machine, which outlive its processes.
class FakeAlarmStore {
  public:
    /// Stream and event.
    using Name = std::pair<std::string, std::string>;

    void save(const Name& name, Date date) { dates_.insert_or_assign(name, date); }
    void clear(const Name& name) { dates_.erase(name); }

    /// The date registered for an event, or none.
    [[nodiscard]] std::optional<Date> date(std::string_view stream, std::string_view event) const {
        const auto found = dates_.find(Name(stream, event));
        return found == dates_.end() ? std::nullopt : std::optional(found->second);
    }

    [[nodiscard]] const std::map<Name, Date>& all() const { return dates_; }

  private:
    std::map<Name, Date> dates_;
};

} // namespace platform
