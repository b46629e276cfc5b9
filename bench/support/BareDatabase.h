#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>

struct sqlite3;
struct sqlite3_stmt;

namespace bench {

/// A database file used through SQLite alone: the floor under everything that is done with one.
/// Every operation throws when it fails.
class BareDatabase {
  public:
    /// Opens the file, or makes it.
    explicit BareDatabase(const std::string& path);

    void execute(const char* text);

    [[nodiscard]] sqlite3* handle() const { return database_.get(); }

  private:
    struct Close {
        void operator()(sqlite3* database) const;
    };

    std::unique_ptr<sqlite3, Close> database_;
};

/// A statement that was prepared once and is used over and over. Goes before its database.
class BareStatement {
  public:
    BareStatement(const BareDatabase& database, const char* text);

    /// Runs it to its end, with a number and bytes, neither of them copied, for its two question
    /// marks.
    void insert(double number, std::span<const std::uint8_t> bytes);

    /// Runs it and calls `takeBytes` with the bytes of the first column of each row, where SQLite
    /// has them.
    template <typename BytesTaker>
    void scan(BytesTaker&& takeBytes) {
        while (step()) {
            takeBytes(firstColumn());
        }
        reset();
    }

  private:
    struct Finalize {
        void operator()(sqlite3_stmt* statement) const;
    };

    [[nodiscard]] bool step();
    [[nodiscard]] std::span<const std::uint8_t> firstColumn() const;
    void reset();

    std::unique_ptr<sqlite3_stmt, Finalize> statement_;
};

/// Sets `database`, a new file or an old one, up as the event store does with its own.
void configureAsEventStore(BareDatabase& database);

/// Makes the tables that the event store has.
void makeEventTables(BareDatabase& database);

} // namespace bench
