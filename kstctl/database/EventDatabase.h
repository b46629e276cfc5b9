#pragma once

#include "kstctl/database/EventRows.h"
#include "platform/Date.h"
#include "platform/Result.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace kstctl {

class Progress;

/// What is wanted of the events; their number and the upload date always come with it.
struct EventQuery {
    bool withEvents = false;
    /// Only this one.
    std::optional<std::int64_t> id;
    /// Is told of each row that was read.
    Progress* progress = nullptr;
};

/// What the database held at one moment.
struct EventDatabase {
    std::uint64_t count = 0;
    /// The stored text of the date at which the next upload is due.
    std::optional<std::string> uploadDate;
    /// In the order of their numbers, which is that in which they came.
    EventRows events;
};

/// Reads the analytics database in one transaction, which ends before this returns.
///
/// The daemon may be at work on it meanwhile: nothing that it does has to wait, and no file is
/// made, changed or left behind, whether it runs or not. Another program's lock is waited for, up
/// to `patience`.
///
/// Fails with ExitStatus::missing (also while the daemon has made the file and not yet what is in
/// it), ::unreadable, ::malformed (not a database, a damaged one, or one of another kind) or
/// ::failed (locked; a log beside it that only the daemon can work off; or no room for what was
/// read).
[[nodiscard]] platform::Result<EventDatabase> readEventDatabase(const std::string& path,
                                                                const EventQuery& query,
                                                                std::chrono::milliseconds patience);

/// Stores `date` as the one from which on the next event uploads, in one short transaction, and
/// nothing else; returns the stored text. The daemon may be at work on the database meanwhile: it
/// looks at the date anew with every event. A lock is waited for up to `patience`.
///
/// Fails as readEventDatabase does, and makes no database.
[[nodiscard]] platform::Result<std::string> storeUploadDate(const std::string& path,
                                                            platform::Timestamp date,
                                                            std::chrono::milliseconds patience);

} // namespace kstctl
