#pragma once

#include <cstdint>

namespace kstd {

class KSTDSQLite;

/// Knows the revision of its owner's tables and how to bring older ones up to it. Called while the
/// database is being opened, on the thread that opens it.
class KSTDSQLiteDelegate {
  public:
    KSTDSQLiteDelegate() = default;
    KSTDSQLiteDelegate(const KSTDSQLiteDelegate&) = delete;
    KSTDSQLiteDelegate& operator=(const KSTDSQLiteDelegate&) = delete;
    virtual ~KSTDSQLiteDelegate() = default;

    /// The revision that the tables shall have; 0 means that revisions are not used.
    [[nodiscard]] virtual std::int32_t userVersion() = 0;

    /// Brings the tables, which are of revision `fromVersion`, up to the current schema. Called
    /// inside the opening's transaction, with the database already usable. False, and all tables
    /// are dropped and made anew.
    ///
    /// That the migration was done is written after its transaction has ended. A crash in between
    /// leads to another call, for tables that are migrated already: it must do them no harm.
    [[nodiscard]] virtual bool migrateDatabase(KSTDSQLite& database, std::int32_t fromVersion) = 0;
};

} // namespace kstd
