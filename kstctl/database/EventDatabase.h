#pragma once

#include "platform/Result.h"
#include "platform/Value.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kstctl {

/// A row of the events' table.
struct StoredEvent {
    std::int64_t id = 0;
    /// When it was added, in seconds since 2001-01-01 UTC; none when the row does not say.
    std::optional<double> added;
    /// The event as a property list; none when the row holds something else.
    std::optional<platform::Bytes> data;
};

/// What is wanted of the events; their number and the upload date always come with it.
struct EventQuery {
    bool withEvents = false;
    /// Only this one.
    std::optional<std::int64_t> id;
};

/// What the database held at one moment.
struct EventDatabase {
    std::uint64_t count = 0;
    /// The stored text of the date at which the next upload is due.
    std::optional<std::string> uploadDate;
    /// In the order of their numbers, which is that in which they came.
    std::vector<StoredEvent> events;
};

/// Reads the analytics database in one transaction, which ends before this returns.
///
/// The daemon may be at work on it meanwhile: nothing that it does has to wait, and no file is
/// made, changed or left behind, whether it runs or not. Another program's lock is waited for, up
/// to `patience`.
///
/// Fails with ExitStatus::missing, ::unreadable, ::malformed (not a database, a damaged one, or one
/// of another kind) or ::failed (locked; or a log beside it that only the daemon can work off).
[[nodiscard]] platform::Result<EventDatabase> readEventDatabase(const std::string& path,
                                                                const EventQuery& query,
                                                                std::chrono::milliseconds patience);

} // namespace kstctl
