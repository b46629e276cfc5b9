// What an opening asks of SQLite, statement by statement, and what it makes of the answers.

#include "base/Concat.h"
#include "base/NotCopied.h"
#include "kstd/Analytics/SQLite/DatabaseFile.h"
#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

#include <algorithm>
#include <deque>
#include <functional>
#include <sqlite3.h>
#include <utility>

namespace kstd {
namespace {

/// While it exists each new connection of the process is handed to `prepare` before anybody uses
/// it.
class NewConnections : private base::NotCopied {
  public:
    explicit NewConnections(std::function<void(sqlite3* db)> prepare) {
        prepare_ = std::move(prepare);
        sqlite3_auto_extension(reinterpret_cast<void (*)()>(hand));
    }
    ~NewConnections() {
        sqlite3_reset_auto_extension();
        prepare_ = nullptr;
    }

  private:
    static int hand(sqlite3* db, const char** /*message*/, const sqlite3_api_routines* /*api*/) {
        prepare_(db);
        return SQLITE_OK;
    }

    static inline std::function<void(sqlite3*)> prepare_;
};

/// While it exists files of databases can be opened to which so many writes succeed in all. Those
/// behind them fail with the code.
class FailingWrites : private base::NotCopied {
  public:
    FailingWrites(std::size_t succeed, int code) : ownOpen_(files_->xOpen) {
        left_ = succeed;
        code_ = code;
        files_->xOpen = [](sqlite3_vfs* /*files*/, const char* path, sqlite3_file* file, int flags,
                           int* outFlags) {
            return current_->open(path, file, flags, outFlags);
        };
        current_ = this;
    }
    ~FailingWrites() {
        files_->xOpen = ownOpen_;
        current_ = nullptr;
    }

  private:
    int open(const char* path, sqlite3_file* file, int flags, int* outFlags) {
        const int code = ownOpen_(files_, path, file, flags, outFlags);
        if (file->pMethods != nullptr) {
            ownWrite_ = file->pMethods->xWrite;
            methods_.push_back(*file->pMethods);
            methods_.back().xWrite = [](sqlite3_file* written, const void* bytes, int size,
                                        sqlite3_int64 at) {
                if (left_ == 0) {
                    return code_;
                }
                --left_;
                return ownWrite_(written, bytes, size, at);
            };
            file->pMethods = &methods_.back();
        }
        return code;
    }

    static inline FailingWrites* current_ = nullptr;
    static inline std::size_t left_ = 0;
    static inline int code_ = SQLITE_OK;
    static inline decltype(sqlite3_io_methods::xWrite) ownWrite_ = nullptr;
    /// For files that are still open at the end.
    static inline std::deque<sqlite3_io_methods> methods_;
    sqlite3_vfs* const files_ = sqlite3_vfs_find(registerDatabaseFiles());
    decltype(sqlite3_vfs::xOpen) const ownOpen_;
};

class OpeningStatementsTest : public DatabaseFixture {
  protected:
    /// Runs `steps` and gives every statement that began meanwhile, with what was bound to it.
    [[nodiscard]] static Texts statementsOf(const std::function<void()>& steps) {
        Texts texts;
        const NewConnections traced([&texts](sqlite3* db) {
            sqlite3_trace_v2(db, SQLITE_TRACE_STMT, appendStatement, &texts);
        });
        steps();
        return texts;
    }

    /// Opens a database and closes it again.
    void openOnce(const std::string& schema = kSchema) { openDatabase(schema)->close(); }

    /// Opens a new file on a connection that `prepare` has had in its hands, which must fail.
    void expectFailure(const std::function<void(sqlite3* db)>& prepare) {
        const NewConnections prepared(prepare);
        const auto made = database();
        platform::Error error;
        EXPECT_FALSE(made->openWithError(&error));
        EXPECT_EQ(error, (platform::Error{platform::kGenericErrorDomain, 0,
                                          "Error opening db at " + path + ", "}));
        EXPECT_FALSE(made->isOpen());
        EXPECT_EQ(made->openCount(), 0U);
        EXPECT_EQ(made->statementsBySQL().size(), 0U);
    }

    static void run(sqlite3* db, const std::string& SQL) {
        EXPECT_EQ(sqlite3_exec(db, SQL.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << SQL;
    }

    /// As the log shows it: line feeds as escapes.
    [[nodiscard]] static std::string failedToRun(const std::string& text, int code) {
        std::string shown;
        for (const char character : text) {
            shown += character == '\n' ? "\\n" : std::string(1, character);
        }
        return "KSTDSQLite: Error executing SQL: \"" + shown + "\" (" + std::to_string(code) + ")";
    }

    static constexpr char kMakeProperties[] = "create table if not exists Properties (\n"
                                              "    key    text primary key,\n"
                                              "    value  text\n"
                                              ");";
    static constexpr char kStored[] = "insert or replace into Properties (key, value) values ";
    static constexpr char kNow[] = "721692800.000000";

  private:
    static int appendStatement(unsigned /*kind*/, void* texts, void* statement, void* text) {
        // What runs inside of another statement comes as a comment.
        const std::string_view began = static_cast<const char*>(text);
        if (!began.starts_with("--")) {
            char* const expanded = sqlite3_expanded_sql(static_cast<sqlite3_stmt*>(statement));
            static_cast<Texts*>(texts)->emplace_back(expanded);
            sqlite3_free(expanded);
        }
        return 0;
    }
};

TEST_F(OpeningStatementsTest, OfANewFile) {
    EXPECT_EQ(
        statementsOf([this] { openOnce(); }),
        (Texts{"pragma journal_mode = WAL", "pragma synchronous = normal",
               "pragma auto_vacuum = FULL", "begin exclusive",
               "select name from sqlite_master where type = 'table' AND name = 'Properties'",
               kMakeProperties, "select value from Properties where key = 'SchemaVersion'",
               "pragma user_version", kMakeProperties, "create table T (a, b);",
               base::concat(kStored, "('Created','", kNow, "')"), "end",
               "select value from Properties where key = 'LastVacuum'", "VACUUM",
               base::concat(kStored, "('LastVacuum','", kNow, "')"),
               base::concat(kStored, "('SchemaVersion','", database()->schemaVersion(), "')")}));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningStatementsTest, OfACurrentFile) {
    openOnce();
    EXPECT_EQ(
        statementsOf([this] { openOnce(); }),
        (Texts{"pragma journal_mode = WAL", "pragma synchronous = normal",
               "pragma auto_vacuum = FULL", "begin exclusive",
               "select name from sqlite_master where type = 'table' AND name = 'Properties'",
               "select value from Properties where key = 'SchemaVersion'", "pragma user_version",
               "end", "select value from Properties where key = 'LastVacuum'"}));
}

TEST_F(OpeningStatementsTest, OfAChangedSchema) {
    openOnce();
    const std::string changed = "create table T (a, b) ;";
    const auto made = database(changed);
    made->setUserVersion(7);
    EXPECT_EQ(statementsOf([&made] { ASSERT_TRUE(made->openWithError(nullptr)); }),
              (Texts{"pragma journal_mode = WAL", "pragma synchronous = normal",
                     "pragma auto_vacuum = FULL", "begin exclusive",
                     "select name from sqlite_master where type = 'table' AND name = 'Properties'",
                     "select value from Properties where key = 'SchemaVersion'",
                     "pragma user_version", "select name from sqlite_master where type = 'table'",
                     "drop table Properties", "drop table T", kMakeProperties, changed,
                     base::concat(kStored, "('Created','", kNow, "')"), "end",
                     "select value from Properties where key = 'LastVacuum'", "VACUUM",
                     base::concat(kStored, "('LastVacuum','", kNow, "')"),
                     base::concat(kStored, "('SchemaVersion','", made->schemaVersion(), "')"),
                     "pragma user_version = 7"}));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningStatementsTest, RebuildingKeepsAUserVersionThatIsNotUsed) {
    openOnce();
    ASSERT_EQ(OtherConnection(path).run("pragma user_version = 7"), SQLITE_OK);
    const Texts statements = statementsOf([this] { openOnce("create table T (a, b) ;"); });
    EXPECT_EQ(std::count(statements.begin(), statements.end(), "drop table T"), 1);
    EXPECT_EQ(OtherConnection(path).one("pragma user_version"), "7");
}

TEST_F(OpeningStatementsTest, IndexCalledPropertiesIsNotTheTable) {
    ASSERT_EQ(OtherConnection(path).run("create table X (a); create index Properties on X (a)"),
              SQLITE_OK);
    const Texts statements = statementsOf([this] { openOnce(); });
    EXPECT_EQ(std::count(statements.begin(), statements.end(), kMakeProperties), 0);
    // Before the version is looked for, and when the tables are made.
    const Texts said = lines();
    const std::string refused = failedToRun(std::string(kMakeProperties) + "\n", SQLITE_ERROR);
    EXPECT_EQ(std::count(said.begin(), said.end(), refused), 2) << testing::PrintToString(said);
    EXPECT_EQ(said.front(), refused);
}

TEST_F(OpeningStatementsTest, StatementsAreRemovedBeforeTablesAreDropped) {
    class Leaver final : public KSTDSQLiteDelegate {
      public:
        [[nodiscard]] std::int32_t userVersion() override { return 0; }
        [[nodiscard]] bool migrateDatabase(KSTDSQLite& database,
                                           std::int32_t /*fromVersion*/) override {
            left = database.statementForSQL("select a from T");
            EXPECT_TRUE(left->step());
            return false;
        }
        std::shared_ptr<KSTDSQLiteStatement> left;
    };
    openDatabase()->insertOrReplaceInto("T", {{"a", 1}});
    const auto delegate = std::make_shared<Leaver>();
    const auto made = database("create table if not exists T (a, b) ;");
    made->setDelegate(delegate);
    ASSERT_TRUE(made->openWithError(nullptr));
    const Texts said = lines();
    ASSERT_GE(said.size(), 3U);
    EXPECT_EQ(said[0], "KSTDSQLite: Statement not reset after last use: \"select a from T\"");
    EXPECT_EQ(said[1], failedToRun("drop table Properties", SQLITE_LOCKED));
    EXPECT_EQ(said[2], failedToRun("drop table T", SQLITE_LOCKED));
    delegate->left->reset();
}

TEST_F(OpeningStatementsTest, UnknownSynchronousModeIsFoundBehindTheJournalMode) {
    KSTDSQLite made(path, kSchema, environment);
    made.setSynchronousMode(3);
    EXPECT_DEATH(static_cast<void>(made.openWithError(nullptr)), "");
    // Where a database says that it is written through a log.
    EXPECT_EQ(read(path).substr(18, 2), "\x02\x02");

    const std::string content(4096, 'x');
    write(path, content);
    EXPECT_FALSE(made.openWithError(nullptr));
    EXPECT_EQ(lines(), Texts{failedToRun("pragma journal_mode = WAL", SQLITE_NOTADB)});
}

/// What somebody else has prepared on the connection keeps it for a while, and no longer.
TEST_F(OpeningStatementsTest, FailedOpeningClosesTheConnectionWithItsLastStatement) {
    const std::string content(4096, 'x');
    write(path, content);
    sqlite3_stmt* kept = nullptr;
    const auto before = sqlite3_memory_used();
    expectFailure([&kept](sqlite3* db) {
        EXPECT_EQ(sqlite3_prepare_v2(db, "select 1", -1, &kept, nullptr), SQLITE_OK);
    });
    EXPECT_GT(sqlite3_memory_used(), before);
    EXPECT_EQ(sqlite3_finalize(kept), SQLITE_OK);
    EXPECT_EQ(sqlite3_memory_used(), before);
}

/// Builds on a new file that fail for the storage, at every statement of theirs, and one that has
/// room.
TEST_F(OpeningStatementsTest, BuildThatTheStorageFailsLeavesNothingAndIsTriedAgain) {
    bool failed = true;
    int pages = 1;
    for (; failed; ++pages) {
        SCOPED_TRACE(std::to_string(pages) + " pages");
        const auto made = database("create table T (a, b); create table U (a);");
        // Keeps the connection: it does not go with whatever it has begun.
        sqlite3_stmt* kept = nullptr;
        {
            const NewConnections small([pages, &kept](sqlite3* db) {
                run(db, "pragma max_page_count = " + std::to_string(pages));
                EXPECT_EQ(sqlite3_prepare_v2(db, "select 1", -1, &kept, nullptr), SQLITE_OK);
            });
            failed = !made->openWithError(nullptr);
        }
        const Texts said = lines();
        if (failed) {
            EXPECT_FALSE(made->isOpen());
            OtherConnection other(path);
            EXPECT_EQ(other.rows("select name from sqlite_master"), Texts());
            EXPECT_EQ(other.run("begin exclusive; end"), SQLITE_OK);
            ASSERT_EQ(said.size(), 1U) << testing::PrintToString(said);
            EXPECT_TRUE(said.front().ends_with(" (13)")) << said.front();
            ASSERT_TRUE(made->openWithError(nullptr));
            EXPECT_EQ(lines(), Texts());
        }
        sqlite3_finalize(kept);
        EXPECT_EQ(made->allTableNames(), (Texts{"Properties", "T", "U"}));
        EXPECT_EQ(made->propertyForKey("SchemaVersion"), made->schemaVersion());
        made->close();
        made->remove();
    }
    EXPECT_GE(pages, 5);
}

TEST_F(OpeningStatementsTest, BuildOfWhichAWriteFailsLeavesNothingAndIsTriedAgain) {
    for (const int code : {SQLITE_IOERR_WRITE, SQLITE_NOMEM, SQLITE_CANTOPEN}) {
        bool failed = true;
        std::size_t writes = 0;
        for (; failed; ++writes) {
            SCOPED_TRACE(base::concat("code ", code, ", after ", writes, " writes"));
            const auto made = database();
            {
                const FailingWrites failing(writes, code);
                failed = !made->openWithError(nullptr);
            }
            static_cast<void>(lines());
            if (failed) {
                EXPECT_FALSE(made->isOpen());
                EXPECT_EQ(OtherConnection(path).rows("select name from sqlite_master"), Texts());
                ASSERT_TRUE(made->openWithError(nullptr));
                EXPECT_EQ(lines(), Texts());
            }
            EXPECT_EQ(made->allTableNames(), (Texts{"Properties", "T"}));
            made->close();
            made->remove();
            static_cast<void>(lines());
        }
        EXPECT_GE(writes, 5U);
    }
}

TEST_F(OpeningStatementsTest, ReadOnlyConnectionFailsToBuild) {
    expectFailure([](sqlite3* db) { run(db, "pragma query_only = on"); });
    EXPECT_EQ(lines(), (Texts{failedToRun("begin exclusive", SQLITE_READONLY),
                              failedToRun(std::string(kMakeProperties) + "\n", SQLITE_READONLY)}));
    openOnce();
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningStatementsTest, BuildWhoseDateCannotBeStoredLeavesNothing) {
    const auto made = database("create table T (a, b); pragma query_only = on;");
    EXPECT_FALSE(made->openWithError(nullptr));
    EXPECT_FALSE(made->isOpen());
    EXPECT_EQ(lines(),
              Texts{"KSTDSQLite: Failed to step (8): \"insert or replace into Properties (key, "
                    "value) values (?,?)\""});
    OtherConnection other(path);
    EXPECT_EQ(other.rows("select name from sqlite_master"), Texts());
}

/// Only the storage is tried again: any other failure stays as before.
TEST_F(OpeningStatementsTest, BuildThatFailsForAnotherReasonCounts) {
    const NewConnections refusing([](sqlite3* db) {
        sqlite3_set_authorizer(
            db,
            [](void* /*unused*/, int action, const char* table, const char* /*b*/,
               const char* /*c*/, const char* /*d*/) {
                return action == SQLITE_CREATE_TABLE && std::string_view(table) == "T" ? SQLITE_DENY
                                                                                       : SQLITE_OK;
            },
            nullptr);
    });
    const auto opened = openDatabase();
    EXPECT_EQ(lines(), Texts{failedToRun(kSchema, SQLITE_AUTH)});
    EXPECT_EQ(opened->allTableNames(), Texts{"Properties"});
    EXPECT_EQ(opened->propertyForKey("SchemaVersion"), opened->schemaVersion());
}

} // namespace
} // namespace kstd
