#include "tests/kstd/Analytics/SQLite/StatementFixture.h"

namespace kstd {
namespace {

using platform::Bytes;
using platform::Null;
using platform::Value;
using platform::ValueList;
using platform::ValueMap;

constexpr char kOneOfEach[] = "select 4294967297 as number, 2.75 as fraction, 'text' as words, "
                              "x'00ab' as bytes, null as missing";

class StatementColumnsTest : public StatementFixture {};

TEST_F(StatementColumnsTest, TypesAndNames) {
    KSTDSQLiteStatement row = statement(kOneOfEach);
    ASSERT_TRUE(row.step());
    ASSERT_EQ(row.columnCount(), 5);
    const std::pair<int, std::string_view> columns[] = {{SQLITE_INTEGER, "number"},
                                                        {SQLITE_FLOAT, "fraction"},
                                                        {SQLITE_TEXT, "words"},
                                                        {SQLITE_BLOB, "bytes"},
                                                        {SQLITE_NULL, "missing"}};
    for (int index = 0; index < 5; ++index) {
        EXPECT_EQ(row.columnTypeAtIndex(index), columns[index].first);
        EXPECT_EQ(row.columnNameAtIndex(index), columns[index].second);
    }
}

TEST_F(StatementColumnsTest, NumbersAreConvertedAsSQLiteDoes) {
    KSTDSQLiteStatement row = statement(kOneOfEach);
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.intAtIndex(0), 1);
    EXPECT_EQ(row.int64AtIndex(0), 4294967297);
    EXPECT_EQ(row.doubleAtIndex(0), 4294967297.0);
    EXPECT_EQ(row.intAtIndex(1), 2);
    EXPECT_EQ(row.doubleAtIndex(1), 2.75);
    EXPECT_EQ(row.intAtIndex(2), 0);
    EXPECT_EQ(row.int64AtIndex(4), 0);
    EXPECT_EQ(row.doubleAtIndex(4), 0.0);
}

TEST_F(StatementColumnsTest, TextsAndBuffersAreCopies) {
    KSTDSQLiteStatement row = statement(kOneOfEach);
    ASSERT_TRUE(row.step());
    const std::optional<std::string> text = row.textAtIndex(2);
    const std::optional<Bytes> bytes = row.blobAtIndex(3);
    row.reset();
    EXPECT_EQ(text, "text");
    EXPECT_EQ(bytes, (Bytes{0, 0xab}));
}

TEST_F(StatementColumnsTest, BytesOfABlobAreSeenWhereSQLiteHasThem) {
    KSTDSQLiteStatement row = statement("select x'00ab', x'', null, 'ab', 1, 1.5");
    ASSERT_TRUE(row.step());
    const auto bytes = row.blobBytesAtIndex(0);
    ASSERT_TRUE(bytes);
    EXPECT_EQ(Bytes(bytes->begin(), bytes->end()), (Bytes{0, 0xab}));
    EXPECT_EQ(bytes->data(), sqlite3_column_blob(row.handle(), 0));
    const auto empty = row.blobBytesAtIndex(1);
    ASSERT_TRUE(empty);
    EXPECT_TRUE(empty->empty());
    for (int index = 2; index <= 6; ++index) {
        EXPECT_FALSE(row.blobBytesAtIndex(index)) << index;
    }
}

TEST_F(StatementColumnsTest, WithoutAPointerThereIsNone) {
    KSTDSQLiteStatement row = statement("select null, x'', ''");
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.blobAtIndex(0), std::nullopt);
    EXPECT_EQ(row.textAtIndex(0), std::nullopt);
    EXPECT_EQ(row.blobAtIndex(1), std::nullopt);
    EXPECT_EQ(row.textAtIndex(2), "");
}

TEST_F(StatementColumnsTest, ATextEndsAtItsFirstZeroByte) {
    KSTDSQLiteStatement row = statement("select cast(x'610062' as text)");
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.textAtIndex(0), "a");
}

TEST_F(StatementColumnsTest, OneObjectOfEachType) {
    KSTDSQLiteStatement row = statement(kOneOfEach);
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.allObjects(),
              (ValueList{std::int64_t{4294967297}, 2.75, "text", Bytes{0, 0xab}, Null()}));
    EXPECT_EQ(row.allObjectsByColumnName(), (ValueMap{{"number", std::int64_t{4294967297}},
                                                      {"fraction", 2.75},
                                                      {"words", "text"},
                                                      {"bytes", Bytes{0, 0xab}}}));
    expectLines({});
}

TEST_F(StatementColumnsTest, EmptyIsNotNull) {
    KSTDSQLiteStatement row = statement("select x'' as bytes, '' as words");
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.allObjects(), (ValueList{Bytes(), ""}));
    EXPECT_EQ(row.allObjectsByColumnName(), (ValueMap{{"bytes", Bytes()}, {"words", ""}}));
}

TEST_F(StatementColumnsTest, ADateComesBackAsANumber) {
    KSTDSQLiteStatement insert = statement(kInsertA);
    insert.bindValue(platform::Timestamp{721692800.25}, 0);
    EXPECT_FALSE(insert.step());
    KSTDSQLiteStatement row = statement("select a from t");
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.objectAtIndex(0), Value(721692800.25));
}

TEST_F(StatementColumnsTest, OfTwoColumnsWithOneNameTheLaterCounts) {
    KSTDSQLiteStatement row = statement("select 1 as x, 2 as x, null as x");
    ASSERT_TRUE(row.step());
    EXPECT_EQ(row.allObjectsByColumnName(), (ValueMap{{"x", std::int64_t{2}}}));
}

TEST_F(StatementColumnsTest, OutsideTheColumnsIsNull) {
    KSTDSQLiteStatement row = statement("select 1");
    ASSERT_TRUE(row.step());
    for (const int index : {1, -1, 1000}) {
        EXPECT_EQ(row.objectAtIndex(index), Value());
        EXPECT_EQ(row.columnNameAtIndex(index), "");
        EXPECT_EQ(row.intAtIndex(index), 0);
        EXPECT_EQ(row.textAtIndex(index), std::nullopt);
    }
    expectLines({});
}

TEST_F(StatementColumnsTest, WithoutARowEverythingIsNull) {
    KSTDSQLiteStatement row = statement("select 1 as x, 2 as y");
    EXPECT_EQ(row.allObjects(), (ValueList{Null(), Null()}));
    EXPECT_TRUE(row.allObjectsByColumnName().empty());
    expectLines({});
}

TEST_F(StatementColumnsTest, AStatementWithoutColumnsHasNone) {
    KSTDSQLiteStatement insert = statement("insert into t values (1, 2)");
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(insert.columnCount(), 0);
    EXPECT_TRUE(insert.allObjects().empty());
    EXPECT_TRUE(insert.allObjectsByColumnName().empty());
}

TEST_F(StatementColumnsTest, TheColumnsAreCountedAfterTheStep) {
    KSTDSQLiteStatement all = statement("select * from t");
    execute("alter table t add column c default 3; insert into t (a, b) values (1, 2)");
    ASSERT_TRUE(all.step());
    EXPECT_EQ(all.allObjects(), (ValueList{std::int64_t{1}, std::int64_t{2}, std::int64_t{3}}));
}

} // namespace
} // namespace kstd
