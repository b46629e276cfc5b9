#pragma once

#include "platform/Result.h"

#include <string>
#include <sys/stat.h>

namespace kstctl {

/// What stands at the path of a database, and beside it.
struct DatabaseFiles {
    /// The database's file is in WAL mode.
    bool usesLog = false;
    bool hasLog = false;
    /// The log has something in it.
    bool isLogFilled = false;
    /// The index of the log is there.
    bool hasIndex = false;
    /// Changes with every write to the database's own file.
    struct stat state {};

    /// Nobody has the database open, and all of it is in its own file.
    [[nodiscard]] bool isAtRest() const {
        return usesLog && (!hasLog || (!isLogFilled && !hasIndex));
    }

    /// Whether all is as it was. For a database that was at rest that means that nothing was
    /// written between the two looks; of one in use it tells whether somebody came or went.
    [[nodiscard]] bool isSameAs(const DatabaseFiles& earlier) const;

    /// Fails with ExitStatus::missing, ::unreadable or ::malformed (not a regular file).
    [[nodiscard]] static platform::Result<DatabaseFiles> look(const std::string& path);
};

} // namespace kstctl
