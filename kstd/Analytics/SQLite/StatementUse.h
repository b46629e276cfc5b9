#pragma once

#include "kstd/Analytics/SQLite/KSTDSQLiteStatement.h"

namespace kstd {

/// One use of a statement: ends with its reset, also when something is thrown in between.
class StatementUse {
  public:
    explicit StatementUse(KSTDSQLiteStatement& statement) : statement_(statement) {}
    StatementUse(const StatementUse&) = delete;
    StatementUse& operator=(const StatementUse&) = delete;
    ~StatementUse() { statement_.reset(); }

    KSTDSQLiteStatement& operator*() const { return statement_; }
    KSTDSQLiteStatement* operator->() const { return &statement_; }

  private:
    KSTDSQLiteStatement& statement_;
};

} // namespace kstd
