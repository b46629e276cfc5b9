#pragma once

#include "platform/Date.h"
#include "platform/SystemLog.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// Alarm registrations on disk, so that they outlive the process and a restart of the machine.
///
/// One file for each alarm, <directory>/<stream>/<event>, that holds one line of 21 bytes: the date
/// as 20 digits (nanoseconds since 1970-01-01 UTC), or "none" filled up with blanks after a
/// cancellation. It is overwritten in place, which keeps a registration to one write and one sync.
/// A file that holds anything else stands for an alarm that is due: waking once too often does no
/// harm, a lost alarm does.
class AlarmStore {
  public:
    AlarmStore(std::string directory, SystemLog& log);

    /// The registered alarms of a stream: event names and dates.
    [[nodiscard]] std::vector<std::pair<std::string, Date>> load(std::string_view stream);

    /// Puts the registration on disk before it returns, and makes the directories. A failure is
    /// logged: the alarm then lasts as long as the process. A date that this store has put on disk
    /// before is not written again.
    void save(std::string_view stream, std::string_view event, Date date);

    /// Takes the registration away. Not synced: an alarm that comes back after a power cut fires
    /// once too often, which does no harm.
    void clear(std::string_view stream, std::string_view event);

  private:
    [[nodiscard]] bool knows(const std::string& path, std::optional<Date> date) const;
    [[nodiscard]] static bool makeDirectory(const std::string& path);
    void report(std::string_view what, std::string_view path, int error) const;

    std::string directory_;
    SystemLog& log_;
    /// What each file holds, by its path, as far as this store knows: the date that it has put
    /// there, or that the alarm is cancelled. A date that was only read may not be synced.
    std::map<std::string, std::optional<Date>, std::less<>> known_;
};

} // namespace platform
