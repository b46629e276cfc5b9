#include "kstctl/database/EventDatabase.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"
#include "kstctl/database/EventText.h"
#include "platform/formats/PropertyListCodec.h"
#include "tests/kstd/Analytics/SQLite/OtherConnection.h"
#include "tests/kstd/Analytics/SQLite/SmallDisk.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <sys/stat.h>
#include <unistd.h>

namespace kstctl {
namespace {

namespace fs = std::filesystem;

using kstd::OtherConnection;

constexpr std::chrono::milliseconds kNoPatience{1};

constexpr char kNoIndex[] = ": there is a log beside it, and no index of that log; only who writes "
                            "to it can read it";

/// Another process that works on the database.
class Writer {
  public:
    explicit Writer(const std::string& path)
        : shell_({"/usr/bin/sqlite3", path}, support::Program::Input::pipe) {
        run("pragma synchronous = off");
    }

    /// Returns when it was carried out.
    void run(const std::string& SQL) {
        shell_.writeLine(SQL + ";");
        const std::string done = base::concat("done ", ++count_);
        shell_.writeLine("select '" + done + "';");
        EXPECT_TRUE(shell_.awaitLine(done)) << SQL;
        EXPECT_EQ(shell_.count("rror"), 0U) << SQL;
    }

    void add(const std::string& data) {
        run("insert into all_events (timestamp, data) values (1.5, cast('" + data + "' as blob))");
    }

    void kill() {
        shell_.signal(SIGKILL);
        EXPECT_EQ(shell_.awaitEnd(), 128 + SIGKILL);
    }

    /// Closes the database in order.
    void end() {
        shell_.endInput();
        EXPECT_EQ(shell_.awaitEnd(), 0);
    }

  private:
    support::Program shell_;
    int count_ = 0;
};

std::vector<StoredEvent> rowsOf(const EventDatabase& database) {
    std::vector<StoredEvent> rows;
    EXPECT_FALSE(database.events.visit([&rows](const auto& event) { rows.push_back(event); }));
    EXPECT_EQ(rows.size(), database.events.size());
    return rows;
}

class EventDatabaseTest : public testing::Test {
  protected:
    /// A database as the daemon makes it, with events of that text as their data.
    void make(const std::vector<std::string>& events, const std::string& mode = "WAL") {
        OtherConnection connection(path);
        connection.run("pragma synchronous = off; pragma journal_mode = " + mode);
        connection.run("create table Properties (key text primary key, value text)");
        connection.run("create table all_events (id INTEGER PRIMARY KEY AUTOINCREMENT,"
                       "timestamp REAL,data BLOB)");
        connection.run("insert into Properties values ('upload_date', '2026-11-20T08:15:00Z')");
        connection.run("begin");
        for (const std::string& event : events) {
            add(connection, event);
        }
        connection.run("commit");
    }

    static void add(OtherConnection& connection, const std::string& data) {
        EXPECT_EQ(connection.run("insert into all_events (timestamp, data) values (1.5, cast('" +
                                 data + "' as blob))"),
                  SQLITE_OK);
    }

    [[nodiscard]] platform::Result<EventDatabase> read(const EventQuery& query = {
                                                           .withEvents = true, .id = {}}) const {
        return readEventDatabase(path, query, kNoPatience);
    }

    /// The data of the events as texts.
    [[nodiscard]] std::vector<std::string> events() const {
        const auto result = read();
        EXPECT_TRUE(result) << result.error().description;
        std::vector<std::string> texts;
        for (const StoredEvent& event : rowsOf(result.value())) {
            texts.emplace_back(event.data->begin(), event.data->end());
        }
        EXPECT_EQ(result.value().count, texts.size());
        return texts;
    }

    void expectFailure(ExitStatus status, const std::string& reason) const {
        const auto result = read();
        ASSERT_FALSE(result);
        EXPECT_EQ(result.error().description, base::concat(path, reason));
        EXPECT_EQ(statusOf(result.error()), status);
    }

    /// Every file in the directory with what tells whether it was changed.
    [[nodiscard]] std::map<std::string, std::size_t> files() const {
        std::map<std::string, std::size_t> all;
        for (const auto& entry : fs::directory_iterator(directory.path())) {
            all[entry.path().filename().string()] = std::hash<std::string>()(content(entry.path()));
        }
        return all;
    }

    [[nodiscard]] static std::string content(const std::string& file) {
        std::ifstream stream(file, std::ios::binary);
        return {std::istreambuf_iterator<char>(stream), {}};
    }

    void write(const std::string& content) const {
        std::ofstream(path, std::ios::binary) << content;
    }

    using Texts = std::vector<std::string>;

    support::TemporaryDirectory directory;
    std::string path = directory.file("events.db");
};

TEST_F(EventDatabaseTest, DatabaseThatNobodyHasOpen) {
    make({"a", "b"});
    const auto before = files();
    ASSERT_EQ(before.size(), 1U);
    EXPECT_EQ(events(), (Texts{"a", "b"}));
    EXPECT_EQ(files(), before);
}

TEST_F(EventDatabaseTest, DatabaseThatSomebodyWritesTo) {
    make({});
    Writer writer(path);
    for (std::size_t count = 1; count <= 20; ++count) {
        writer.add("x");
        const auto before = files();
        ASSERT_EQ(before.size(), 3U);
        EXPECT_EQ(events().size(), count);
        EXPECT_EQ(files(), before);
    }
    // The log is worked off and begun anew, which a reader would keep from happening.
    writer.run("pragma wal_checkpoint(TRUNCATE)");
    EXPECT_EQ(fs::file_size(path + "-wal"), 0U);
    EXPECT_EQ(events().size(), 20U);
    writer.add("y");
    EXPECT_EQ(events().size(), 21U);
    writer.end();
    EXPECT_EQ(files().size(), 1U);
    EXPECT_EQ(events().size(), 21U);
    EXPECT_EQ(files().size(), 1U);
}

TEST_F(EventDatabaseTest, ExclusiveTransactionOfTheDaemonIsNotWaitedFor) {
    make({"a"});
    Writer writer(path);
    writer.run("begin exclusive");
    writer.add("b");
    EXPECT_EQ(events(), Texts{"a"});
    writer.run("commit");
    EXPECT_EQ(events(), (Texts{"a", "b"}));
}

TEST_F(EventDatabaseTest, WriterThatWasKilled) {
    make({"a"});
    Writer first(path);
    first.add("b");
    first.kill();
    const auto before = files();
    ASSERT_EQ(before.size(), 3U);
    EXPECT_EQ(events(), (Texts{"a", "b"}));
    EXPECT_EQ(files(), before);

    // The next writer recovers the log as ever.
    Writer second(path);
    second.run("pragma integrity_check");
    second.add("c");
    EXPECT_EQ(events(), (Texts{"a", "b", "c"}));
    second.kill();

    // Without the index only a writer can tell what the log holds.
    fs::remove(path + "-shm");
    expectFailure(ExitStatus::failed, kNoIndex);
    EXPECT_EQ(files().size(), 2U);
}

/// Reading a hole in memory that is a file's takes a block in some file systems, this one included.
TEST_F(EventDatabaseTest, IndexWithHolesOnAFullDisk) {
    const kstd::SmallDisk disk(directory.file("disk"));
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a small file system needs root";
    }
    path = disk.file("events.db");
    make({"a"});
    Writer writer(path);
    writer.add("b");
    {
        const base::FileDescriptor index(::open((path + "-shm").c_str(), O_WRONLY | O_CLOEXEC));
        ASSERT_EQ(::fallocate(index.get(), FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, 0,
                              static_cast<off_t>(fs::file_size(path + "-shm"))),
                  0);
    }
    disk.fill();
    EXPECT_EQ(support::exitStatusOfChild([this] {
                  expectFailure(ExitStatus::failed, ": database or disk is full (13)");
                  return HasFailure() ? 1 : 0;
              }),
              0);
    writer.kill();
}

TEST_F(EventDatabaseTest, DateStoredOnADiskThatIsShort) {
    const kstd::SmallDisk disk(directory.file("disk"), kstd::SmallDisk::Blocks::ofOneKiB);
    if (!disk.isMounted()) {
        GTEST_SKIP() << "mounting a file system from a file needs root, mkfs.ext4 and a loop "
                        "device";
    }
    path = disk.file("events.db");
    make({"a"});
    int refused = 0;
    for (std::uint64_t free = 0; free <= 64; free += 4) {
        SCOPED_TRACE(std::to_string(free) + " KiB free");
        disk.leaveFree(free * 1024);
        const int status = support::exitStatusOfChild([this] {
            const auto stored = storeUploadDate(path, platform::Timestamp{0}, kNoPatience);
            if (stored) {
                return 0;
            }
            EXPECT_EQ(stored.error().description, path + ": database or disk is full (13)");
            EXPECT_EQ(statusOf(stored.error()), ExitStatus::failed);
            return HasFailure() ? 1 : 2;
        });
        ASSERT_TRUE(status == 0 || status == 2) << status;
        refused += status == 2 ? 1 : 0;
        disk.makeRoom();
    }
    EXPECT_GT(refused, 1);
    EXPECT_LT(refused, 17);
}

TEST_F(EventDatabaseTest, WritersThatComeAndGo) {
    make({});
    constexpr std::size_t kWriters = 15;
    support::Program writers({"/bin/bash", "-c",
                              "for ((i = 0; i < " + std::to_string(kWriters) +
                                  "; i++)); do sqlite3 \"$0\" \"pragma busy_timeout = 30000; "
                                  "insert into all_events (data) values (x'78')\" || exit; done",
                              path});
    std::size_t seen = 0;
    while (seen < kWriters && !HasFailure()) {
        // One that ends locks everybody out for a moment.
        const auto result = readEventDatabase(path, {}, support::kPatience);
        ASSERT_TRUE(result) << result.error().description;
        EXPECT_GE(result.value().count, seen);
        seen = result.value().count;
    }
    EXPECT_EQ(writers.awaitEnd(), 0);
    // One that has ended while it was read has left its log to the next one.
    Writer(path).end();
    EXPECT_EQ(files().size(), 1U);
    EXPECT_EQ(OtherConnection(path).one("pragma integrity_check"), "ok");
}

TEST_F(EventDatabaseTest, EmptyLogIsNone) {
    make({"a"});
    std::ofstream(path + "-wal").close();
    EXPECT_EQ(events(), Texts{"a"});
    EXPECT_EQ(files().size(), 2U);
}

TEST_F(EventDatabaseTest, DirectoryThatCannotBeWritten) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to become somebody who may not write";
    }
    make({"a"});
    fs::permissions(directory.path(), fs::perms(0755));
    fs::permissions(path, fs::perms(0644));
    EXPECT_EQ(support::exitStatusOfChild([this] {
                  constexpr uid_t kNobody = 65534;
                  return ::setuid(kNobody) == 0 && events() == Texts{"a"} ? 0 : 1;
              }),
              0);
    EXPECT_EQ(files().size(), 1U);

    fs::permissions(path, fs::perms(0600));
    EXPECT_EQ(support::exitStatusOfChild([this] {
                  constexpr uid_t kNobody = 65534;
                  const bool isNobody = ::setuid(kNobody) == 0;
                  expectFailure(ExitStatus::unreadable, ": Permission denied");
                  return isNobody && !HasFailure() ? 0 : 1;
              }),
              0);
}

TEST_F(EventDatabaseTest, OtherModeThanWal) {
    make({"a"}, "DELETE");
    EXPECT_EQ(events(), Texts{"a"});
    Writer writer(path);
    writer.run("begin exclusive");
    expectFailure(ExitStatus::failed, ": database is locked (5)");
    writer.run("commit");
    EXPECT_EQ(events(), Texts{"a"});
    EXPECT_EQ(files().size(), 1U);
}

TEST_F(EventDatabaseTest, LockOnTheWholeFile) {
    make({"a"});
    Writer writer(path);
    writer.run("pragma locking_mode = exclusive");
    writer.add("b");
    expectFailure(ExitStatus::failed, ": database is locked (5)");
}

TEST_F(EventDatabaseTest, WhatIsNoDatabaseOfEvents) {
    expectFailure(ExitStatus::missing, ": No such file or directory");
    write("something else, and quite long. something else, and quite long.");
    expectFailure(ExitStatus::malformed, ": file is not a database (26)");
    EXPECT_EQ(files().size(), 1U);
    fs::remove(path);
    { OtherConnection(path).run("create table other (id)"); }
    expectFailure(ExitStatus::malformed, ": not a database of kstd's events");
    fs::remove(path);
    {
        OtherConnection(path).run(
            "create view all_events as select 1; create view Properties as select 2");
    }
    expectFailure(ExitStatus::malformed, ": not a database of kstd's events");
    fs::remove(path);
    {
        OtherConnection other(path);
        other.run("create table all_events (other); create table Properties (key, value)");
    }
    expectFailure(ExitStatus::malformed, ": no such column: id (1)");
    fs::remove(path);
    fs::create_directory(path);
    expectFailure(ExitStatus::malformed, " is not a regular file");
    fs::remove(path);
    ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
    expectFailure(ExitStatus::malformed, " is not a regular file");
}

TEST_F(EventDatabaseTest, OneThatIsBeingMade) {
    write("");
    expectFailure(ExitStatus::missing, ": nothing is stored in it yet");
    EXPECT_EQ(files().size(), 1U);
    fs::remove(path);
    OtherConnection daemon(path);
    daemon.run("pragma journal_mode = WAL");
    expectFailure(ExitStatus::missing, ": nothing is stored in it yet");
    daemon.run("begin exclusive; create table Properties (key text primary key, value text)");
    expectFailure(ExitStatus::missing, ": nothing is stored in it yet");
    daemon.run("create table all_events (id integer primary key autoincrement, timestamp real, "
               "data blob); commit");
    EXPECT_EQ(events(), Texts());
}

TEST_F(EventDatabaseTest, DamagedDatabase) {
    make(Texts(200, std::string(100, 'x')));
    const std::string whole = content(path);
    // Cut in the middle.
    write(whole.substr(0, whole.size() / 2));
    const auto cut = read();
    ASSERT_FALSE(cut);
    EXPECT_EQ(statusOf(cut.error()), ExitStatus::malformed) << cut.error().description;
    // Every page but the first overwritten.
    std::string damaged = whole;
    std::fill(damaged.begin() + 4096, damaged.end(), '\x5a');
    write(damaged);
    const auto overwritten = read();
    ASSERT_FALSE(overwritten);
    EXPECT_EQ(statusOf(overwritten.error()), ExitStatus::malformed);
}

TEST_F(EventDatabaseTest, PathWithEveryKindOfCharacter) {
    path = directory.file("a b?c#d%20e&mode=rwc'\"ä.db");
    make({"a"});
    EXPECT_EQ(events(), Texts{"a"});
}

TEST_F(EventDatabaseTest, RowsOfEveryKind) {
    make({"a"});
    {
        OtherConnection writer(path);
        writer.run("insert into all_events (timestamp, data) values (null, null), (7, 'text'), "
                   "('late', x'')");
        writer.run("update Properties set value = null");
    }
    const auto result = read();
    ASSERT_TRUE(result);
    const EventDatabase& database = result.value();
    EXPECT_EQ(database.count, 4U);
    EXPECT_FALSE(database.uploadDate);
    const auto events = rowsOf(database);
    ASSERT_EQ(events.size(), 4U);
    EXPECT_EQ(events[0].added, 1.5);
    EXPECT_FALSE(events[1].added);
    EXPECT_FALSE(events[1].data);
    EXPECT_EQ(events[2].added, 7.0);
    EXPECT_FALSE(events[2].data);
    EXPECT_FALSE(events[3].added);
    EXPECT_EQ(events[3].data, platform::Bytes());
    EXPECT_EQ(events[3].id, 4);
}

TEST_F(EventDatabaseTest, OneEventOrNoneAtAll) {
    make({"a", "b", "c"});
    const auto second = read({.withEvents = true, .id = 2});
    ASSERT_EQ(second.value().events.size(), 1U);
    EXPECT_EQ(rowsOf(second.value())[0].id, 2);
    EXPECT_EQ(second.value().count, 3U);
    EXPECT_EQ(read({.withEvents = true, .id = 4}).value().events.size(), 0U);
    const auto numbers = read({.withEvents = false, .id = {}});
    EXPECT_EQ(numbers.value().events.size(), 0U);
    EXPECT_EQ(numbers.value().count, 3U);
    EXPECT_EQ(numbers.value().uploadDate, "2026-11-20T08:15:00Z");
}

TEST(EventTextTest, EventsAsTheyAreShown) {
    platform::PropertyListCodec propertyLists;
    const platform::ValueMap attributes = {
        {"bytes", platform::Bytes{1, 0xff}},
        {"date", platform::Timestamp{0.5}},
        {"eventType", "policy"},
        {"flag", true},
        {"list", platform::ValueList{std::int32_t{-1}, "x\x1b"}},
        {"map", platform::ValueMap{{"real", 0.25}}},
    };
    const auto event = ReadableEvent::of(
        {.id = 9, .added = 0, .data = propertyLists.binary(attributes).value()}, propertyLists);
    EXPECT_EQ(event.type(), "policy");
    EXPECT_EQ(JSONForm(event.report()),
              R"({"id":9,"added":0.0,"addedText":"2001-01-01T00:00:00Z","event":{"bytes":"01ff",)"
              R"("date":"2001-01-01T00:00:00Z","eventType":"policy","flag":true,)"
              R"("list":[-1,"x\u001B"],"map":{"real":0.25}}})"
              "\n");
    EXPECT_EQ(lineOf(event.attributes->at("list")), R"([-1,"x\u001B"])");
    EXPECT_EQ(lineOf(event.attributes->at("eventType")), "policy");
    EXPECT_EQ(lineOf(event.attributes->at("flag")), "true");
    EXPECT_EQ(lineOf(event.attributes->at("map")), R"({"real":0.25})");
}

TEST(EventTextTest, RowsWithoutAnEvent) {
    platform::PropertyListCodec propertyLists;
    const auto list = propertyLists.binary(platform::ValueList()).value();
    for (const std::optional<platform::Bytes>& data :
         {std::optional<platform::Bytes>(), std::optional(platform::Bytes()),
          std::optional(platform::Bytes{'x'}), std::optional(list)}) {
        const auto event = ReadableEvent::of({.id = 1, .added = {}, .data = data}, propertyLists);
        EXPECT_FALSE(event.type());
        EXPECT_EQ(event.addedText(), "");
        EXPECT_EQ(JSONForm(event.report()), R"({"id":1,"added":null,"event":null,)"
                                            R"("eventUnknown":"no event in this row"})"
                                            "\n");
    }
}

} // namespace
} // namespace kstctl
