#pragma once

#include "base/NotCopied.h"
#include "platform/Date.h"

#include <optional>
#include <string>
#include <string_view>

namespace kstd {

/// Dates as texts in the pattern yyyy-MM-dd'T'HH:mm:ssZZZZZ, Gregorian calendar. Whoever wants
/// another pattern overrides both directions. Has no state: may be used from any thread.
class DateFormatter : private base::NotCopied {
  public:
    virtual ~DateFormatter() = default;

    /// In UTC, with "Z". A fraction of a second is cut off towards the past. A date outside the
    /// years 0001 to 9999 is written as the nearest second within them, and NaN as 2001-01-01.
    [[nodiscard]] virtual std::string text(platform::Timestamp date) const;

    /// Reads a text of that pattern with the zone "Z", "+hh:mm" or "-hh:mm". None for everything
    /// else: a fraction, a blank, another form of the zone, a day or an hour that does not exist,
    /// a 60th second.
    [[nodiscard]] virtual std::optional<platform::Timestamp> date(std::string_view text) const;
};

} // namespace kstd
