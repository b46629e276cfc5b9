#include "kstctl/database/ReadOnlyFiles.h"

#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include <sqlite3.h>

namespace kstctl {

namespace {

constexpr char kName[] = "kstctl-read-only";

sqlite3_vfs* systemFiles = nullptr;

/// Without this a connection that may only read a database would still make the log beside it.
int openToRead(sqlite3_vfs* /*files*/, const char* path, sqlite3_file* file, int flags,
               int* outFlags) {
    constexpr int kWriting = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_DELETEONCLOSE;
    const int reading = (flags & ~kWriting) | SQLITE_OPEN_READONLY;
    return systemFiles->xOpen(systemFiles, path, file, reading, outFlags);
}

int refuseToDelete(sqlite3_vfs* /*files*/, const char* /*path*/, int /*syncDirectory*/) {
    return SQLITE_IOERR_DELETE;
}

} // namespace

const char* registerReadOnlyFiles() {
    static sqlite3_vfs files = [] {
        systemFiles = sqlite3_vfs_find(kstd::registerDatabaseFiles());
        sqlite3_vfs copy = systemFiles != nullptr ? *systemFiles : sqlite3_vfs{};
        copy.pNext = nullptr;
        copy.zName = kName;
        copy.xOpen = openToRead;
        copy.xDelete = refuseToDelete;
        return copy;
    }();
    static const bool isRegistered =
        systemFiles != nullptr && sqlite3_vfs_register(&files, 0) == SQLITE_OK;
    return isRegistered ? kName : nullptr;
}

} // namespace kstctl
