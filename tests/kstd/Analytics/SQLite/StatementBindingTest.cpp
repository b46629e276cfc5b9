#include "tests/kstd/Analytics/SQLite/StatementFixture.h"

#include <cstddef>
#include <limits>
#include <utility>

namespace kstd {
namespace {

using platform::Bytes;
using platform::Value;

constexpr double kInfinity = std::numeric_limits<double>::infinity();
constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
constexpr int kIntMax = std::numeric_limits<int>::max();
constexpr int kIntMin = std::numeric_limits<int>::min();

class StatementBindingTest : public StatementFixture {
  protected:
    /// What column a holds once the statement has run, as type and SQL literal.
    std::string inserted() {
        execute("delete from t");
        EXPECT_FALSE(insert.step());
        insert.reset();
        const std::vector<std::string> rows = stored();
        EXPECT_EQ(rows.size(), 1U);
        return rows.empty() ? std::string() : rows.front();
    }

    std::string insertedValue(const Value& value) {
        insert.bindValue(value, 0);
        return inserted();
    }

    void expectInserted(const std::vector<std::pair<Value, std::string>>& cases) {
        for (const auto& [value, expected] : cases) {
            SCOPED_TRACE(expected);
            EXPECT_EQ(insertedValue(value), expected);
        }
        expectLines({});
    }

    void bindOneOfEach(int index) {
        const Bytes bytes = {1};
        const std::string text = "x";
        insert.bindInt(1, index);
        insert.bindInt64(1, index);
        insert.bindDouble(1, index);
        insert.bindBlob(&bytes, index);
        insert.bindText(&text, index);
    }

    KSTDSQLiteStatement insert = statement(kInsertA);
};

TEST_F(StatementBindingTest, IntegersAtTheirLimits) {
    insert.bindInt(std::numeric_limits<std::int32_t>::min(), 0);
    EXPECT_EQ(inserted(), "integer|-2147483648");
    insert.bindInt(std::numeric_limits<std::int32_t>::max(), 0);
    EXPECT_EQ(inserted(), "integer|2147483647");
    insert.bindInt64(std::numeric_limits<std::int64_t>::min(), 0);
    EXPECT_EQ(inserted(), "integer|-9223372036854775808");
    insert.bindInt64(std::numeric_limits<std::int64_t>::max(), 0);
    EXPECT_EQ(inserted(), "integer|9223372036854775807");
}

TEST_F(StatementBindingTest, DoublesKeepTheirFraction) {
    insert.bindDouble(-2.75, 0);
    EXPECT_EQ(inserted(), "real|-2.75");
    insert.bindDouble(kInfinity, 0);
    EXPECT_EQ(inserted(), "real|Inf");
    insert.bindDouble(kNaN, 0); // SQLite has none
    EXPECT_EQ(inserted(), "null|NULL");
}

TEST_F(StatementBindingTest, OnlyANullBufferIsNull) {
    const Bytes bytes = {0, 0xab, 0};
    const Bytes empty;
    insert.bindBlob(&bytes, 0);
    EXPECT_EQ(inserted(), "blob|X'00AB00'");
    insert.bindBlob(&empty, 0);
    EXPECT_EQ(inserted(), "blob|X''");
    insert.bindBlob(nullptr, 0);
    EXPECT_EQ(inserted(), "null|NULL");
}

TEST_F(StatementBindingTest, OnlyANullTextIsNull) {
    const std::string text = "it's \xc3\xbc";
    const std::string empty;
    insert.bindText(&text, 0);
    EXPECT_EQ(inserted(), "text|'it''s \xc3\xbc'");
    insert.bindText(&empty, 0);
    EXPECT_EQ(inserted(), "text|''");
    insert.bindText(nullptr, 0);
    EXPECT_EQ(inserted(), "null|NULL");
    expectLines({});
}

TEST_F(StatementBindingTest, ATextEndsAtItsFirstZeroByte) {
    const std::string text("ab\0c", 4);
    insert.bindText(&text, 0);
    EXPECT_EQ(inserted(), "text|'ab'");
    EXPECT_EQ(insertedValue(text), "text|'ab'");
}

TEST_F(StatementBindingTest, TextsAndBuffersAreNotCopied) {
    std::string text = "before";
    insert.bindText(&text, 0);
    text = "behind";
    EXPECT_EQ(inserted(), "text|'behind'");
    Bytes bytes = {1, 2};
    insert.bindBlob(&bytes, 0);
    bytes[1] = 3;
    EXPECT_EQ(inserted(), "blob|X'0103'");
}

TEST_F(StatementBindingTest, NullTakesTheBindingBack) {
    insert.bindInt(1, 0);
    insert.bindNullAtIndex(0);
    EXPECT_EQ(inserted(), "null|NULL");
    expectLines({});
}

TEST_F(StatementBindingTest, AnUnresetStatementIsNotBound) {
    const std::string line = "KSTDSQLite: Statement is not reset: \"insert into t (a) values (?)\"";
    insert.bindValue("kept", 0);
    EXPECT_FALSE(insert.step());
    bindOneOfEach(0);
    expectLines({line, line, line, line, line});
    insert.bindValue(std::uint8_t{1}, 0);
    insert.bindValue(Bytes{1}, 0);
    insert.bindValue(platform::UniqueIdentifier(), 0);
    insert.bindValue("x", 0);
    insert.bindValue(platform::Timestamp{1}, 0);
    insert.bindValue(platform::Error(), 0);
    insert.bindValue(platform::Link{"a:b"}, 0);
    expectLines({line, line, line, line, line, line, line});
    insert.bindValue(platform::ValueList(), 0);
    expectLines({"KSTDSQLite: Can't bind object of type list"});
    // Another run of the same use has the binding of the first.
    EXPECT_FALSE(insert.step());
    EXPECT_EQ(stored(), (std::vector<std::string>{"text|'kept'", "text|'kept'"}));
}

TEST_F(StatementBindingTest, NullIsLeftToSQLiteToRefuse) {
    EXPECT_FALSE(insert.step());
    insert.bindNullAtIndex(0);
    insert.bindValue(platform::Null(), 0);
    expectLines({"KSTDSQLite: sqlite3_bind_null error", "KSTDSQLite: sqlite3_bind_null error"});
}

TEST_F(StatementBindingTest, AnIndexOutOfRangeIsLoggedAsItWasGiven) {
    for (const int index : {1, -1, 1000000, kIntMax - 1, kIntMax, kIntMin}) {
        bindOneOfEach(index);
        insert.bindBlob(nullptr, index);
        const std::string rest =
            " at " + std::to_string(index) + ": \"insert into t (a) values (?)\"";
        expectLines(
            {"KSTDSQLite: Error binding int" + rest, "KSTDSQLite: Error binding int64" + rest,
             "KSTDSQLite: Error binding double" + rest, "KSTDSQLite: Error binding blob" + rest,
             "KSTDSQLite: Error binding text" + rest, "KSTDSQLite: Error binding blob" + rest});
        insert.bindNullAtIndex(index);
        expectLines({"KSTDSQLite: sqlite3_bind_null error"});
    }
    EXPECT_EQ(inserted(), "null|NULL");
}

TEST_F(StatementBindingTest, ATooLongTextIsLogged) {
    const int longest = sqlite3_limit(db, SQLITE_LIMIT_LENGTH, 10);
    const Bytes bytes(11, 1);
    insert.bindValue("12345678901", 0);
    insert.bindBlob(&bytes, 0);
    expectLines({"KSTDSQLite: Error binding text at 0: \"insert into t (a) values (?)\"",
                 "KSTDSQLite: Error binding blob at 0: \"insert into t (a) values (?)\""});
    insert.bindValue("1234567890", 0);
    expectLines({});
    sqlite3_limit(db, SQLITE_LIMIT_LENGTH, longest);
}

TEST_F(StatementBindingTest, SmallIntegerValues) {
    expectInserted({
        {true, "integer|1"},
        {false, "integer|0"},
        {std::int8_t{-128}, "integer|-128"},
        {std::uint8_t{255}, "integer|255"},
        {std::int16_t{-32768}, "integer|-32768"},
        {std::uint16_t{65535}, "integer|65535"},
        {std::int32_t{kIntMin}, "integer|-2147483648"},
        {std::int32_t{kIntMax}, "integer|2147483647"},
        {std::uint32_t{2147483647}, "integer|2147483647"},
        {std::uint32_t{2147483648}, "integer|-2147483648"},
        {std::uint32_t{4294967295}, "integer|-1"},
    });
}

TEST_F(StatementBindingTest, LargeIntegerValues) {
    expectInserted({
        {std::numeric_limits<std::int64_t>::min(), "integer|-9223372036854775808"},
        {std::numeric_limits<std::int64_t>::max(), "integer|9223372036854775807"},
        {std::int64_t{4294967295}, "integer|4294967295"},
        {std::uint64_t{9223372036854775807U}, "integer|9223372036854775807"},
        {std::uint64_t{9223372036854775808U}, "integer|-9223372036854775808"},
        {std::uint64_t{18446744073709551615U}, "integer|-1"},
    });
}

TEST_F(StatementBindingTest, FloatsBecome32BitIntegers) {
    expectInserted({
        {2.75F, "integer|2"},
        {-2.75F, "integer|-2"},
        {0.999F, "integer|0"},
        {2147483520.0F, "integer|2147483520"},
        {2147483648.0F, "integer|2147483647"},
        {-2147483648.0F, "integer|-2147483648"},
        {-3e9F, "integer|-2147483648"},
        {1e38F, "integer|2147483647"},
        {static_cast<float>(kInfinity), "integer|2147483647"},
        {static_cast<float>(-kInfinity), "integer|-2147483648"},
        {static_cast<float>(kNaN), "integer|0"},
    });
}

TEST_F(StatementBindingTest, DoublesBecome64BitIntegers) {
    expectInserted({
        {2.75, "integer|2"},
        {-2.75, "integer|-2"},
        {4294967296.5, "integer|4294967296"},
        {9223372036854774784.0, "integer|9223372036854774784"},
        {9223372036854775808.0, "integer|9223372036854775807"},
        {-9223372036854775808.0, "integer|-9223372036854775808"},
        {-1e300, "integer|-9223372036854775808"},
        {kInfinity, "integer|9223372036854775807"},
        {-kInfinity, "integer|-9223372036854775808"},
        {kNaN, "integer|0"},
    });
}

TEST_F(StatementBindingTest, ValuesThatAreNoNumbers) {
    expectInserted({
        {Bytes{0xab, 0}, "blob|X'AB00'"},
        {Bytes(), "blob|X''"},
        {platform::UniqueIdentifier{{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 255}},
         "blob|X'000102030405060708090A0B0C0D0EFF'"},
        {"text", "text|'text'"},
        {"", "text|''"},
        {platform::Null(), "null|NULL"},
        {platform::Timestamp{721692800.5}, "real|721692800.5"},
        {platform::Timestamp{0}, "real|0.0"},
        {platform::Timestamp{kNaN}, "null|NULL"},
        {platform::Link{"https://example.test/a?b"}, "text|'https://example.test/a?b'"},
    });
}

TEST_F(StatementBindingTest, AnErrorIsArchivedWithAllItsParts) {
    const platform::Error error{"system", -2, "No such file: \xc3\xbc"};
    insert.bindValue(error, 0);
    EXPECT_FALSE(insert.step());
    insert.reset();
    KSTDSQLiteStatement select = statement("select a from t");
    ASSERT_TRUE(select.step());
    const std::optional<Bytes> archive = select.blobAtIndex(0);
    ASSERT_TRUE(archive);
    EXPECT_EQ(std::string(archive->begin(), archive->begin() + 8), "bplist00");
    EXPECT_EQ(propertyLists.value(*archive),
              Value(platform::ValueMap{{"domain", "system"},
                                       {"code", std::int64_t{-2}},
                                       {"description", "No such file: \xc3\xbc"}}));
    expectLines({});
}

TEST_F(StatementBindingTest, AnErrorThatCannotBeArchivedIsNotBound) {
    insert.bindInt(7, 0);
    propertyLists.failNextBinary({});
    insert.bindValue(platform::Error(), 0);
    expectLines({"KSTDSQLite: Can't bind object of type error"});
    EXPECT_EQ(inserted(), "integer|7");
}

TEST_F(StatementBindingTest, ListsAndMapsAreNotBound) {
    insert.bindInt(7, 0);
    insert.bindValue(platform::ValueList{1, 2}, 0);
    insert.bindValue(platform::ValueMap{{"a", 1}}, 0);
    expectLines({"KSTDSQLite: Can't bind object of type list",
                 "KSTDSQLite: Can't bind object of type map"});
    EXPECT_EQ(inserted(), "integer|7");
}

TEST_F(StatementBindingTest, ValuesAreBoundInOrder) {
    KSTDSQLiteStatement both = statement("insert into t (b, a) values (?, ?)");
    both.bindValues({"b", "a"});
    EXPECT_FALSE(both.step());
    both.reset();
    EXPECT_EQ(query("select a, b from t"), (std::vector<std::string>{"a|b"}));
    both.bindValues({});
    expectLines({});
    both.bindValues({1, 2, 3});
    expectLines({"KSTDSQLite: Error binding int at 2: \"insert into t (b, a) values (?, ?)\""});
}

TEST_F(StatementBindingTest, BoundValuesOutliveTheCallersAndStayWhereTheyAre) {
    std::string SQL = "select ?";
    std::string expected = "0";
    for (int i = 1; i < 100; ++i) {
        SQL += " || ?";
        expected += std::to_string(i);
    }
    KSTDSQLiteStatement join = statement(SQL);
    for (int i = 0; i < 100; ++i) {
        join.bindValue(std::to_string(i), i);
    }
    EXPECT_EQ(join.temporaryBoundObjects().size(), 100U);
    ASSERT_TRUE(join.step());
    EXPECT_EQ(join.textAtIndex(0), expected);
    join.reset();
    EXPECT_TRUE(join.temporaryBoundObjects().empty());
}

TEST_F(StatementBindingTest, EveryKindThatNeedsItIsKept) {
    insert.bindValue(platform::Null(), 0);
    insert.bindValue(1, 0);
    insert.bindValue(platform::Timestamp{1}, 0);
    EXPECT_TRUE(insert.temporaryBoundObjects().empty());
    insert.bindValue(Bytes{1}, 0);
    insert.bindValue("x", 0);
    insert.bindValue(platform::UniqueIdentifier(), 0);
    insert.bindValue(platform::Link{"a:b"}, 0);
    insert.bindValue(platform::Error(), 0);
    const std::list<Value>& kept = insert.temporaryBoundObjects();
    ASSERT_EQ(kept.size(), 5U);
    EXPECT_EQ(kept.front(), Value(Bytes{1}));
    EXPECT_EQ(*std::next(kept.begin(), 1), Value("x"));
    EXPECT_EQ(*std::next(kept.begin(), 2), Value(Bytes(16)));
    EXPECT_EQ(*std::next(kept.begin(), 3), Value("a:b"));
    EXPECT_TRUE(kept.back().is<Bytes>());
}

TEST_F(StatementBindingTest, AKeptValueIsHandedBack) {
    const Value& first = insert.retainedTemporaryBoundObject("first");
    for (int i = 0; i < 100; ++i) {
        insert.retainedTemporaryBoundObject(i);
    }
    EXPECT_EQ(&first, &insert.temporaryBoundObjects().front());
    EXPECT_EQ(first, Value("first"));
}

} // namespace
} // namespace kstd
