// The linker sends the program's calls of sqlite3_prepare_v2 to __wrap_sqlite3_prepare_v2, and
// those of __real_sqlite3_prepare_v2 to SQLite.

#include "bench/support/PreparedStatements.h"

#include <set>
#include <sqlite3.h>
#include <string>
#include <utility>

// NOLINTBEGIN(bugprone-reserved-identifier): the names are the linker's.
extern "C" {
int __real_sqlite3_prepare_v2(sqlite3* database, const char* text, int size, sqlite3_stmt** handle,
                              const char** tail);
int __wrap_sqlite3_prepare_v2(sqlite3* database, const char* text, int size, sqlite3_stmt** handle,
                              const char** tail);
}

namespace {

// The benchmark runs on one thread.
std::size_t calls = 0;
std::set<std::pair<const sqlite3*, std::string>> texts;

} // namespace

int __wrap_sqlite3_prepare_v2(sqlite3* database, const char* text, int size, sqlite3_stmt** handle,
                              const char** tail) {
    ++calls;
    const std::string whole =
        size < 0 ? std::string(text) : std::string(text, static_cast<std::size_t>(size));
    texts.emplace(database, whole);
    return __real_sqlite3_prepare_v2(database, text, size, handle, tail);
}
// NOLINTEND(bugprone-reserved-identifier)

namespace bench {

PreparedStatements countPreparedStatements(const Work& work) {
    calls = 0;
    texts.clear();
    work();
    return {calls, calls - texts.size()};
}

} // namespace bench
