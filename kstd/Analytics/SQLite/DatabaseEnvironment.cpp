#include "kstd/Analytics/SQLite/DatabaseEnvironment.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"

#include <sqlite3.h>
#include <system_error>

namespace kstd {
namespace {

constexpr int kCauseMask = 0xff;

bool isOfStorage(int code) {
    switch (code & kCauseMask) {
    case SQLITE_BUSY:
    case SQLITE_LOCKED:
    case SQLITE_NOMEM:
    case SQLITE_READONLY:
    case SQLITE_IOERR:
    case SQLITE_FULL:
    case SQLITE_CANTOPEN:
        return true;
    default:
        return false;
    }
}

/// Whether the system's last word belongs to the failure.
bool isOfSystem(int code) {
    const int primary = code & kCauseMask;
    // With other codes it is left from something earlier.
    return primary == SQLITE_IOERR || primary == SQLITE_CANTOPEN;
}

} // namespace

void DatabaseCauses::tell(int code, sqlite3* db) {
    const int systemError = db == nullptr ? 0 : sqlite3_system_errno(db);
    std::string line =
        base::concat("kstd: Database: ", path_, ": ", sqlite3_errstr(code), " (", code, ")");
    if (isOfSystem(code) && systemError != 0) {
        line += ", ";
        line += std::generic_category().message(systemError);
    }
    line += ".\n";
    tellOnce(std::move(line), isOfStorage(code) ? Duration::passing : Duration::lasting);
}

void DatabaseCauses::tellOfDirectory(std::string_view description) {
    tellOnce(base::concat("kstd: Database: ", description, ".\n"), Duration::passing);
}

void DatabaseCauses::wrote() {
    std::erase_if(told_, [](const auto& told) { return told.second == Duration::passing; });
}

void DatabaseCauses::tellOnce(std::string line, Duration duration) {
    if (log_ == nullptr || isSilent_) {
        return;
    }
    const auto [told, isNew] = told_.emplace(std::move(line), duration);
    if (isNew) {
        log_->write(platform::LogLevel::warning, told->first,
                    {.messageId = platform::message::kDatabaseFailed});
    }
}

} // namespace kstd
