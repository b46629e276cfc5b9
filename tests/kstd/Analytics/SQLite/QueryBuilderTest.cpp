#include "tests/kstd/Analytics/SQLite/DatabaseFixture.h"

#include <stdexcept>

struct RXOfNoNamespace {};

namespace kstd {
namespace {

using platform::Bytes;
using platform::Null;
using platform::Timestamp;
using platform::ValueMap;

constexpr auto kNoWhere = std::nullopt;
constexpr auto kNoOrder = std::nullopt;
constexpr auto kNoLimit = std::nullopt;

class QueryBuilderTest : public DatabaseFixture {
  protected:
    /// What a call built: the only text that is cached by now.
    [[nodiscard]] std::string text() {
        EXPECT_EQ(opened->statementsBySQL().size(), 1U);
        std::string built =
            opened->statementsBySQL().empty() ? "" : opened->statementsBySQL().begin()->first;
        EXPECT_EQ(lines(), Texts());
        opened->removeAllStatements();
        EXPECT_EQ(lines(), Texts());
        return built;
    }

    void insertThree() {
        for (const std::int64_t i : {1, 2, 3}) {
            opened->insertOrReplaceInto("T", {{"a", i}, {"b", i * i}});
        }
        opened->removeAllStatements();
    }

    [[nodiscard]] static ValueMap row(std::int64_t a, std::int64_t b) {
        return {{"a", a}, {"b", b}};
    }

    void SetUp() override { opened->removeAllStatements(); }

    std::unique_ptr<KSTDSQLite> opened = openDatabase();
    RowList visited;
    const RowVisitor collect = [this](const ValueMap& row, bool& /*stop*/) {
        visited.push_back(row);
    };
};

TEST_F(QueryBuilderTest, SelectReturnsRows) {
    insertThree();
    EXPECT_EQ(opened->select({"a", "b"}, "T"), (RowList{row(1, 1), row(2, 4), row(3, 9)}));
    EXPECT_EQ(text(), "select a, b from T");
    EXPECT_EQ(opened->select({"a", "b"}, "T", "a > ? and b < ?", {1, 9}), RowList{row(2, 4)});
    EXPECT_EQ(text(), "select a, b from T where a > ? and b < ?");
    EXPECT_EQ(opened->select({"a", "b"}, "T", "a > ?", {3}), RowList());
}

TEST_F(QueryBuilderTest, ColumnsThatAreNullAreLeftOut) {
    opened->insertOrReplaceInto("T", {{"a", "x"}, {"b", Null()}});
    EXPECT_EQ(opened->selectAllFrom("T", kNoWhere, {}), (RowList{{{"a", "x"}}}));
}

TEST_F(QueryBuilderTest, OnlyThePlainSelectAddsAnEmptyWhere) {
    EXPECT_EQ(opened->select({"a"}, "T", "", {}), RowList());
    EXPECT_EQ(opened->selectCountFrom("T", "", {}), 0U);
    EXPECT_EQ(lines(), (Texts{"Error preparing statement: select a from T where ",
                              "Error preparing statement: select count(*) as n from T where "}));
    opened->select({"a"}, "T", "", {}, kNoOrder, kNoLimit, collect);
    EXPECT_EQ(text(), "select a from T");
    opened->selectFrom("T", "", {}, kNoOrder, kNoLimit, collect);
    EXPECT_EQ(text(), "select * from T");
    EXPECT_EQ(opened->selectFrom("T", "", {}, kNoLimit), RowList());
    EXPECT_EQ(text(), "select * from T");
    opened->update("T", "a = 1", "", {}, kNoLimit);
    EXPECT_EQ(text(), "update T set a = 1");
}

TEST_F(QueryBuilderTest, VisitorGetsEachRowInOrder) {
    insertThree();
    opened->select({"b", "a"}, "T", "a < ?", {3}, ColumnNames{"a desc", "b"}, 5, collect);
    EXPECT_EQ(visited, (RowList{row(2, 4), row(1, 1)}));
    EXPECT_EQ(text(), "select b, a from T where a < ? order by a desc, b limit 5");
    visited.clear();
    opened->select({}, "T", kNoWhere, {}, kNoOrder, 1, collect);
    EXPECT_EQ(visited, RowList{row(1, 1)});
    EXPECT_EQ(text(), "select * from T limit 1");
    visited.clear();
    opened->selectFrom("T", "b = ?", {9}, ColumnNames{"a"}, kNoLimit, collect);
    EXPECT_EQ(visited, RowList{row(3, 9)});
    EXPECT_EQ(text(), "select * from T where b = ? order by a");
}

TEST_F(QueryBuilderTest, LimitsOfEverySizeAreWritten) {
    insertThree();
    EXPECT_EQ(opened->selectFrom("T", kNoWhere, {}, 0), RowList());
    EXPECT_EQ(text(), "select * from T limit 0");
    EXPECT_EQ(opened->selectFrom("T", kNoWhere, {}, -1).size(), 3U);
    EXPECT_EQ(text(), "select * from T limit -1");
    EXPECT_EQ(opened->selectFrom("T", "a > 0", {}, INT64_MAX).size(), 3U);
    EXPECT_EQ(text(), "select * from T where a > 0 limit 9223372036854775807");
}

TEST_F(QueryBuilderTest, OrderByNothingIsStillWritten) {
    opened->selectFrom("T", kNoWhere, {}, ColumnNames(), kNoLimit, collect);
    EXPECT_EQ(lines(), Texts{"Error preparing statement: select * from T order by "});
}

TEST_F(QueryBuilderTest, StopEndsAfterItsRowAndResets) {
    insertThree();
    opened->selectFrom("T", kNoWhere, {}, kNoOrder, kNoLimit,
                       [this](const ValueMap& row, bool& stop) {
                           EXPECT_FALSE(stop);
                           visited.push_back(row);
                           stop = true;
                       });
    EXPECT_EQ(visited, RowList{row(1, 1)});
    EXPECT_TRUE(opened->statementForSQL("select * from T")->isReset());
    EXPECT_EQ(text(), "select * from T");
}

TEST_F(QueryBuilderTest, RowsWithoutAVisitorAreSteppedThroughAndDropped) {
    insertThree();
    int rows = 0;
    sqlite3_trace_v2(
        opened->db(), SQLITE_TRACE_ROW,
        [](unsigned /*kind*/, void* count, void* /*statement*/, void* /*unused*/) {
            ++*static_cast<int*>(count);
            return 0;
        },
        &rows);
    opened->selectFrom("T", kNoWhere, {}, kNoOrder, kNoLimit, nullptr);
    EXPECT_EQ(rows, 3);
    EXPECT_TRUE(opened->statementForSQL("select * from T")->isReset());
    opened->select({"a"}, "T", "a > ?", {1}, kNoOrder, kNoLimit, nullptr);
    EXPECT_EQ(rows, 5);
    EXPECT_TRUE(opened->statementForSQL("select a from T where a > ?")->isReset());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(QueryBuilderTest, ThrowingVisitorLeavesTheStatementReset) {
    insertThree();
    const RowVisitor throwing = [](const ValueMap& /*row*/, bool& /*stop*/) {
        throw std::runtime_error("no more");
    };
    EXPECT_THROW(opened->selectFrom("T", "a > ?", {0}, kNoOrder, kNoLimit, throwing),
                 std::runtime_error);
    const auto statement = opened->statementForSQL("select * from T where a > ?");
    EXPECT_TRUE(statement->isReset());
    EXPECT_TRUE(statement->temporaryBoundObjects().empty());
    opened->selectFrom("T", "a > ?", {1}, kNoOrder, kNoLimit, collect);
    EXPECT_EQ(visited.size(), 2U);
}

TEST_F(QueryBuilderTest, VisitorMayUseOtherTexts) {
    insertThree();
    opened->selectFrom(
        "T", kNoWhere, {}, kNoOrder, kNoLimit, [this](const ValueMap& row, bool& /*stop*/) {
            const RowList same = opened->selectAllFrom("T", "a = ?", {row.find("a")->second});
            visited.insert(visited.end(), same.begin(), same.end());
        });
    EXPECT_EQ(visited.size(), 3U);
}

TEST_F(QueryBuilderTest, FailedStepEndsTheListEarly) {
    insertThree();
    opened->update("T", "a = -9223372036854775808", "a = 2", {}, kNoLimit);
    EXPECT_EQ(opened->select({"abs(a) as n"}, "T"), (RowList{{{"n", std::int64_t{1}}}}));
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Failed to step (1): \"select abs(a) as n from T\""});
}

TEST_F(QueryBuilderTest, CountIsTheFirstRows) {
    EXPECT_EQ(opened->selectCountFrom("T", kNoWhere, {}), 0U);
    insertThree();
    EXPECT_EQ(opened->selectCountFrom("T", kNoWhere, {}), 3U);
    EXPECT_EQ(text(), "select count(*) as n from T");
    EXPECT_EQ(opened->selectCountFrom("T", "a > ?", {1}), 2U);
    EXPECT_EQ(text(), "select count(*) as n from T where a > ?");
    EXPECT_EQ(opened->selectCountFrom("T", "a > 0 limit 0", {}), 0U);
}

TEST_F(QueryBuilderTest, UpdateRunsOnceToItsEnd) {
    insertThree();
    opened->update("T", "b = b + ?", "a > ?", {100, 1}, kNoLimit);
    EXPECT_EQ(text(), "update T set b = b + ? where a > ?");
    EXPECT_EQ(OtherConnection(path).rows("select b from T"), (Texts{"1", "104", "109"}));
    opened->update("T", "b = ? returning a", kNoWhere, {0}, kNoLimit);
    EXPECT_EQ(OtherConnection(path).one("select sum(b) from T"), "0");
}

TEST_F(QueryBuilderTest, UpdateWritesItsLimit) {
    insertThree();
    opened->update("T", "b = 0", "a > 0", {}, 2);
    // Not every SQLite knows a limit here.
    if (const Texts refused = lines(); !refused.empty()) {
        EXPECT_EQ(refused,
                  Texts{"Error preparing statement: update T set b = 0 where a > 0 limit 2"});
    } else {
        EXPECT_EQ(text(), "update T set b = 0 where a > 0 limit 2");
    }
}

TEST_F(QueryBuilderTest, InsertSortsItsColumnsAndRunsOnce) {
    EXPECT_EQ(opened->insertOrReplaceInto("T", {{"b", "of b"}, {"a", "of a"}}), 1);
    const auto statement = opened->statementForSQL("insert or replace into T (a,b) values (?,?)");
    EXPECT_EQ(opened->insertOrReplaceInto("T", {{"a", "second"}, {"b", Null()}}), 2);
    EXPECT_EQ(opened->statementsBySQL().size(), 1U);
    EXPECT_EQ(OtherConnection(path).rows("select a, b from T"),
              (Texts{"of a|of b", "second|NULL"}));
    EXPECT_EQ(opened->insertOrReplaceInto("T", {{"b", 3}}), 3);
    EXPECT_NE(opened->statementForSQL("insert or replace into T (b) values (?)"), statement);
    EXPECT_EQ(lines(), Texts());
}

TEST_F(QueryBuilderTest, InsertReplacesARowOfTheSameKey) {
    opened->setProperty("old", "k");
    EXPECT_GT(opened->insertOrReplaceInto("Properties", {{"key", "k"}, {"value", "new"}}), 0);
    EXPECT_EQ(opened->propertyForKey("k"), "new");
}

TEST_F(QueryBuilderTest, InsertOfNothingIsNoSQL) {
    EXPECT_EQ(opened->insertOrReplaceInto("T", {{"a", 1}}), 1);
    EXPECT_EQ(opened->insertOrReplaceInto("T", {}), 1);
    EXPECT_EQ(lines(), Texts{"Error preparing statement: insert or replace into T () values ()"});
}

TEST_F(QueryBuilderTest, FailedInsertReturnsTheRowBefore) {
    ASSERT_TRUE(opened->executeSQL("create table N (x not null)"));
    EXPECT_EQ(opened->insertOrReplaceInto("N", {{"x", 1}}), 1);
    EXPECT_EQ(opened->insertOrReplaceInto("N", {{"x", Null()}}), 1);
    EXPECT_EQ(lines(), Texts{"KSTDSQLite: Failed to step (1299): \"insert or replace into N (x) "
                             "values (?)\""});
}

TEST_F(QueryBuilderTest, BoundValuesAreStoredByTheirKinds) {
    const std::vector<std::pair<platform::Value, std::string>> cases{
        {std::uint8_t{255}, "integer|255"},
        {std::uint32_t{4'294'967'295U}, "integer|-1"},
        {UINT64_MAX, "integer|-1"},
        {INT64_MIN, "integer|-9223372036854775808"},
        {2.75, "integer|2"},
        {true, "integer|1"},
        {Timestamp{0.5}, "real|0.5"},
        {Bytes(), "blob|"},
        {Bytes{'x'}, "blob|x"},
        {"", "text|"},
        {"short", "text|short"},
        {std::string(5000, 'l'), "text|" + std::string(5000, 'l')},
        {platform::Link{"https://h/"}, "text|https://h/"},
        {Null(), "null|NULL"},
    };
    for (const auto& [value, stored] : cases) {
        SCOPED_TRACE(stored.substr(0, 40));
        opened->insertOrReplaceInto("T", {{"a", value}});
        EXPECT_EQ(
            OtherConnection(path).one("select typeof(a), a from T order by rowid desc limit 1"),
            stored);
    }
    EXPECT_EQ(opened->select({"a"}, "T", "typeof(a) = ?", {"blob"}).front().at("a"), Bytes());
    EXPECT_EQ(lines(), Texts());
}

TEST_F(QueryBuilderTest, DeleteMatchesEveryValue) {
    insertThree();
    opened->insertOrReplaceInto("T", {{"b", 4}});
    opened->removeAllStatements();
    opened->deleteFrom("T", {{"b", 4}, {"a", Null()}});
    EXPECT_EQ(text(), "delete from T where a is NULL AND b=?");
    EXPECT_EQ(OtherConnection(path).rows("select a from T"), (Texts{"1", "2", "3"}));
    opened->deleteFrom("T", row(2, 4));
    EXPECT_EQ(text(), "delete from T where a=? AND b=?");
    opened->deleteFrom("T", "a = ? or b = ?", {1, 1});
    EXPECT_EQ(text(), "delete from T where a = ? or b = ?");
    EXPECT_EQ(OtherConnection(path).rows("select a from T"), Texts{"3"});
}

TEST_F(QueryBuilderTest, DeleteOfNothingIsNoSQL) {
    opened->deleteFrom("T", ValueMap());
    EXPECT_EQ(lines(), Texts{"Error preparing statement: delete from T where "});
}

TEST_F(QueryBuilderTest, ClosedDatabaseYieldsNothing) {
    opened->close();
    EXPECT_EQ(opened->select({"a"}, "T"), RowList());
    opened->selectFrom("T", kNoWhere, {}, kNoOrder, kNoLimit, collect);
    EXPECT_EQ(visited, RowList());
    EXPECT_EQ(opened->selectCountFrom("T", kNoWhere, {}), 0U);
    opened->update("T", "a = 1", kNoWhere, {}, kNoLimit);
    opened->deleteFrom("T", row(1, 1));
    EXPECT_EQ(lines(), Texts(5, "KSTDSQLite: Database is closed"));
    EXPECT_EQ(opened->insertOrReplaceInto("T", row(1, 1)), -1);
    EXPECT_EQ(lines(), Texts(2, "KSTDSQLite: Database is closed"));
}

struct RXEvent {};
struct RX {};
struct R {};
struct Event {};
struct rxEvent {};
struct Renamed {
    static std::string KSTDSQLiteClassName() { return "RXOther"; }
};
struct RXUnnamed {
    static std::string KSTDSQLiteClassName() { return ""; }
};

TEST_F(QueryBuilderTest, RecordClassTellsItsName) {
    EXPECT_EQ(KSTDSQLiteClassName<RXEvent>(), "RXEvent");
    EXPECT_EQ(KSTDSQLiteClassName<RXOfNoNamespace>(), "RXOfNoNamespace");
    EXPECT_EQ(KSTDSQLiteClassName<KSTDSQLite>(), "KSTDSQLite");
    EXPECT_EQ(KSTDSQLiteClassName<Renamed>(), "RXOther");
    EXPECT_EQ(KSTDSQLiteClassName<RXUnnamed>(), "");
}

TEST_F(QueryBuilderTest, TableOfAClassIsItsNameWithoutThePrefix) {
    EXPECT_EQ(opened->tableNameForClass<RXEvent>(), "Event");
    EXPECT_EQ(opened->tableNameForClass<RX>(), "");
    EXPECT_EQ(opened->tableNameForClass<Renamed>(), "Other");
    EXPECT_EQ(lines(), Texts());
    const auto refused = [](const std::string& name, const std::string& prefix) {
        return Texts{"KSTDSQLite: Object class \"" + name + "\" does not have prefix \"" + prefix +
                     "\""};
    };
    EXPECT_EQ(opened->tableNameForClass<Event>(), std::nullopt);
    EXPECT_EQ(lines(), refused("Event", "RX"));
    EXPECT_EQ(opened->tableNameForClass<R>(), std::nullopt);
    EXPECT_EQ(lines(), refused("R", "RX"));
    EXPECT_EQ(opened->tableNameForClass<rxEvent>(), std::nullopt);
    EXPECT_EQ(lines(), refused("rxEvent", "RX"));
    EXPECT_EQ(opened->tableNameForClass<RXUnnamed>(), std::nullopt);
    EXPECT_EQ(lines(), refused("", "RX"));
    opened->setObjectClassPrefix("Ev");
    EXPECT_EQ(opened->tableNameForClass<Event>(), "ent");
    EXPECT_EQ(opened->tableNameForClass<Renamed>(), std::nullopt);
    EXPECT_EQ(lines(), refused("RXOther", "Ev"));
}

} // namespace
} // namespace kstd
