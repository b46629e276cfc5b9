#pragma once

#include "platform/Date.h"
#include "platform/SystemLog.h"

#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

/// Alarm registrations on disk, so that they outlive the process and a restart of the machine.
///
/// One file for each alarm, <directory>/<stream>/<event>, that holds one line of 21 bytes: the date
/// as 20 digits (nanoseconds since 1970-01-01 UTC), or "none" filled up with blanks after a
/// cancellation. It is overwritten in place, which keeps a registration to one write and one sync;
/// the first of a process syncs the file's name as well.
/// A file that holds anything else stands for an alarm that is due, and a directory that cannot be
/// read for all of them: waking once too often does no harm, a lost alarm does.
///
/// A failure leaves one line with its reason, again only when the reason has changed or it went
/// well in between.
class AlarmStore {
  public:
    /// `events` are the names of alarms that there are. What lies in the directory under another
    /// name is nobody's alarm: it is left alone.
    AlarmStore(std::string directory, std::vector<std::string> events, SystemLog& log);

    /// The registered alarms of a stream: event names and dates. A line names each file that is no
    /// alarm's.
    [[nodiscard]] std::vector<std::pair<std::string, Date>> load(std::string_view stream);

    /// Puts the registration on disk before it returns, and makes the directories; whether it did.
    /// What is on disk after a failure is not known. A date that this store has put on disk before
    /// is not written again.
    [[nodiscard]] bool save(std::string_view stream, std::string_view event, Date date);

    /// Takes the registration away. Not synced: an alarm that comes back after a power cut fires
    /// once too often, which does no harm.
    void clear(std::string_view stream, std::string_view event);

    /// Says that an alarm is given up, with the reason for which it was not saved last.
    void reportLost(std::string_view stream, std::string_view event);

  private:
    [[nodiscard]] bool isAlarm(std::string_view event) const;
    [[nodiscard]] std::string pathOf(std::string_view stream, std::string_view event) const;
    [[nodiscard]] bool knows(const std::string& path, std::optional<Date> date) const;
    [[nodiscard]] bool failToSave(const std::string& path, const std::string& reason);
    void report(std::string_view what, const std::string& path, std::string_view reason);

    std::string directory_;
    std::vector<std::string> events_;
    SystemLog& log_;
    /// What each file holds, by its path, as far as this store knows: the date that it has put
    /// there, or that the alarm is cancelled. A date that was only read may not be synced.
    std::map<std::string, std::optional<Date>, std::less<>> known_;
    /// Files whose names this store has synced.
    std::set<std::string, std::less<>> syncedNames_;
    /// What was said last about each file.
    std::map<std::string, std::string, std::less<>> reported_;
    /// Why each alarm is not on disk.
    std::map<std::string, std::string, std::less<>> reasons_;
};

} // namespace platform
