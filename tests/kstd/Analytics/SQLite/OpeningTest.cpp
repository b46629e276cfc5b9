#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

#include <cerrno>
#include <iostream>

namespace kstd {
namespace {

class OpeningTest : public DatabaseFixture {
  protected:
    [[nodiscard]] platform::Error failureOf(KSTDSQLite& database) {
        platform::Error error;
        EXPECT_FALSE(database.openWithError(&error));
        EXPECT_FALSE(database.isOpen());
        EXPECT_EQ(database.openCount(), 0U);
        return error;
    }

    [[nodiscard]] static platform::Error generic(const std::string& description) {
        return {platform::kGenericErrorDomain, 0, description};
    }
};

TEST_F(OpeningTest, NewFileGetsItsTablesAndProperties) {
    const auto opened = openDatabase();
    EXPECT_TRUE(opened->isOpen());
    EXPECT_EQ(opened->openCount(), 1U);
    EXPECT_FALSE(opened->hasMigrated());
    EXPECT_EQ(lines(), Texts());

    OtherConnection other(path);
    EXPECT_EQ(other.rows("select key, value from Properties order by key"),
              (Texts{"Created|721692800.000000", "LastVacuum|721692800.000000",
                     "SchemaVersion|" + opened->schemaVersion()}));
    EXPECT_EQ(other.rows("select sql from sqlite_master where type = 'table'"),
              (Texts{"CREATE TABLE Properties (\n    key    text primary key,\n    value  text\n)",
                     "CREATE TABLE T (a, b)"}));
    EXPECT_EQ(other.one("pragma journal_mode"), "wal");
    EXPECT_EQ(other.one("pragma user_version"), "0");
}

TEST_F(OpeningTest, SynchronousModeIsTheConnections) {
    for (const std::int64_t mode : {0, 1, 2}) {
        SCOPED_TRACE(mode);
        const auto made = database();
        made->setSynchronousMode(mode);
        ASSERT_TRUE(made->openWithError(nullptr));
        const auto statement = made->statementForSQL("pragma synchronous");
        ASSERT_TRUE(statement->step());
        EXPECT_EQ(statement->int64AtIndex(0), mode);
        statement->reset();
    }
    EXPECT_EQ(lines(), Texts());
}

class StandardErrorLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        std::cerr << text;
    }
};

TEST_F(OpeningTest, UnknownSynchronousModeStopsTheProcess) {
    for (const std::int64_t mode : {-1, 3}) {
        StandardErrorLog standardError;
        KSTDSQLite made(path, kSchema, {standardError, clock, propertyLists});
        made.setSynchronousMode(mode);
        EXPECT_DEATH(static_cast<void>(made.openWithError(nullptr)),
                     "^kstd: AssertMacros: Unknown synchronous mode \\(value: 0x0\\),  file: "
                     "kstd/Analytics/SQLite/KSTDSQLite:[0-9]+\n$");
    }
}

TEST_F(OpeningTest, FilesAndDirectoriesAreForTheOwnerAlone) {
    const std::string deep = directory.file("a/b/c/x.db");
    KSTDSQLite made(deep, kSchema, environment);
    ASSERT_TRUE(made.openWithError(nullptr));
    for (const char* const name : {"a", "a/b", "a/b/c"}) {
        EXPECT_EQ(modeOf(directory.file(name)), 0700U) << name;
    }
    for (const char* const suffix : {"", "-wal", "-shm"}) {
        EXPECT_EQ(modeOf(deep + suffix), 0600U) << suffix;
    }
}

TEST_F(OpeningTest, FilesAreForTheOwnerAloneWhateverTheUmask) {
    for (const mode_t mask : {0U, 022U, 077U, 0277U, 0777U}) {
        const std::string file = directory.file(std::to_string(mask) + ".db");
        const mode_t before = ::umask(mask);
        KSTDSQLite made(file, kSchema, environment);
        EXPECT_TRUE(made.openWithError(nullptr)) << mask;
        ::umask(before);
        for (const char* const suffix : {"", "-wal", "-shm"}) {
            EXPECT_EQ(modeOf(file + suffix), 0600U) << mask << suffix;
        }
    }
}

// Nothing can be made at a link, behind which SQLite then makes the file itself.
TEST_F(OpeningTest, FileThatSQLiteHasMadeIsForTheOwnerAlone) {
    const std::string target = directory.file("target.db");
    std::filesystem::create_symlink(target, path);
    const mode_t before = ::umask(0);
    const auto opened = openDatabase();
    ::umask(before);
    for (const char* const suffix : {"", "-wal", "-shm"}) {
        EXPECT_EQ(modeOf(target + suffix), 0600U) << suffix;
    }
}

TEST_F(OpeningTest, ExistingFileKeepsItsMode) {
    write(path, "");
    ASSERT_EQ(::chmod(path.c_str(), 0644), 0);
    const auto opened = openDatabase();
    EXPECT_EQ(modeOf(path), 0644U);
}

TEST_F(OpeningTest, NestedOpenOnlyCounts) {
    const auto opened = openDatabase();
    opened->removePropertyForKey("SchemaVersion");
    opened->removePropertyForKey("LastVacuum");
    ASSERT_TRUE(opened->executeSQL("pragma synchronous = off"));
    EXPECT_TRUE(opened->openWithError(nullptr));
    EXPECT_EQ(opened->openCount(), 2U);
    OtherConnection other(path);
    EXPECT_EQ(other.rows("select key from Properties"), Texts{"Created"});
    const auto statement = opened->statementForSQL("pragma synchronous");
    ASSERT_TRUE(statement->step());
    EXPECT_EQ(statement->int64AtIndex(0), 0);
    statement->reset();
}

TEST_F(OpeningTest, ParentThatIsARegularFileFailsAtTheOpen) {
    write(directory.file("file"), "content");
    const std::string below = directory.file("file/x.db");
    KSTDSQLite made(below, kSchema, environment);
    EXPECT_EQ(failureOf(made), generic("Error opening db at " + below + ", rc=14(0xe)"));
    EXPECT_EQ(lines(), Texts());

    made.open();
    EXPECT_EQ(lines(), (Texts{"KSTDSQLite: Error opening db at " + below +
                              ": Error opening db at " + below + ", rc=14(0xe)"}));
    EXPECT_FALSE(made.openWithError(nullptr));
    EXPECT_EQ(read(directory.file("file")), "content");
}

TEST_F(OpeningTest, DirectoryThatCannotBeMadeFailsWithTheFileSystemsError) {
    write(directory.file("file"), "content");
    KSTDSQLite made(directory.file("file/sub/x.db"), kSchema, environment);
    const platform::Error error = failureOf(made);
    EXPECT_EQ(error.domain, platform::kSystemErrorDomain);
    EXPECT_EQ(error.code, ENOTDIR);
    EXPECT_EQ(error.description,
              "Cannot make the directory " + directory.file("file/sub") + ": Not a directory");
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, PathOfADirectoryFailsAtTheOpen) {
    KSTDSQLite made(directory.path().string(), kSchema, environment);
    EXPECT_EQ(failureOf(made),
              generic("Error opening db at " + directory.path().string() + ", rc=14(0xe)"));
}

TEST_F(OpeningTest, OpensOnceTheCauseIsGone) {
    ASSERT_TRUE(std::filesystem::create_directory(path));
    const auto made = database();
    static_cast<void>(failureOf(*made));
    std::filesystem::remove(path);
    made->open();
    EXPECT_TRUE(made->isOpen());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, FileOfAnotherProgramIsLeftAsItIs) {
    const std::string content(4096, 'x');
    write(path, content);
    const auto made = database();
    EXPECT_EQ(failureOf(*made), generic("Error opening db at " + path + ", "));
    EXPECT_EQ(lines(),
              Texts{"KSTDSQLite: Error executing SQL: \"pragma journal_mode = WAL\" (26)"});
    EXPECT_EQ(read(path), content);

    made->remove();
    EXPECT_TRUE(made->openWithError(nullptr));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, TruncatedFileFailsAtAPragmaUntilItIsRemoved) {
    openDatabase()->close();
    const std::string whole = read(path);
    constexpr std::size_t kPage = 4096;
    const std::vector<std::pair<std::size_t, int>> codes{
        {16, SQLITE_NOTADB},         {99, SQLITE_CORRUPT},
        {kPage - 1, SQLITE_CORRUPT}, {kPage, SQLITE_CORRUPT},
        {kPage + 1, SQLITE_CORRUPT}, {whole.size() - kPage, SQLITE_CORRUPT}};
    const auto made = database();
    for (const auto& [size, code] : codes) {
        SCOPED_TRACE(size);
        write(path, whole.substr(0, size));
        EXPECT_EQ(failureOf(*made), generic("Error opening db at " + path + ", "));
        EXPECT_EQ(lines(),
                  Texts{"KSTDSQLite: Error executing SQL: \"pragma journal_mode = WAL\" (" +
                        std::to_string(code) + ")"});
        EXPECT_EQ(read(path).size(), size);
    }
    made->remove();
    EXPECT_TRUE(made->openWithError(nullptr));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, ExclusiveTransactionElsewhereFailsAtTheAutomaticVacuum) {
    openDatabase()->close();
    OtherConnection holder(path);
    ASSERT_EQ(holder.run("begin exclusive"), SQLITE_OK);
    const auto made = database();
    EXPECT_EQ(failureOf(*made), generic("Error opening db at " + path + ", "));
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"pragma auto_vacuum = FULL\" (5)"});
    EXPECT_EQ(holder.run("end"), SQLITE_OK);
    EXPECT_TRUE(made->openWithError(nullptr));
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, WithoutAutomaticVacuumAnExclusiveTransactionElsewhereIsNoReasonToFail) {
    const auto made = database();
    made->setShouldVacuum(false);
    ASSERT_TRUE(made->openWithError(nullptr));
    made->close();
    OtherConnection holder(path);
    ASSERT_EQ(holder.run("begin exclusive"), SQLITE_OK);
    EXPECT_TRUE(made->openWithError(nullptr));
    EXPECT_EQ(lines(), (Texts{"KSTDSQLite: Error executing SQL: \"begin exclusive\" (5)",
                              "KSTDSQLite: Error executing SQL: \"end\" (1)"}));
    EXPECT_EQ(holder.run("end"), SQLITE_OK);
    EXPECT_EQ(made->insertOrReplaceInto("T", {{"a", 1}}), 1);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(OpeningTest, LockedFileOfAnotherJournalModeFails) {
    OtherConnection holder(path);
    ASSERT_EQ(holder.run("create table other (x); begin exclusive"), SQLITE_OK);
    const auto made = database();
    EXPECT_EQ(failureOf(*made), generic("Error opening db at " + path + ", "));
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Error executing SQL: \"pragma journal_mode = WAL\" (5)"});
    EXPECT_EQ(holder.run("end"), SQLITE_OK);
    EXPECT_TRUE(made->openWithError(nullptr));
}

} // namespace
} // namespace kstd
