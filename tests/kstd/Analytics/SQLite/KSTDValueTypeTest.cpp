#include "kstd/Analytics/SQLite/KSTDValueType.h"

#include "platform/fake/FakeSystemLog.h"

#include <gtest/gtest.h>

#include <csignal>
#include <cstdio>
#include <cstring>
#include <limits>
#include <thread>
#include <vector>

namespace kstd {
namespace {

using platform::Bytes;
using platform::Value;

/// Where a process that is stopped can be heard.
class StandardErrorLog : public platform::SystemLog {
  public:
    void write(platform::LogLevel level, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        const char* const name = level == platform::LogLevel::error ? "error" : "another level";
        std::fprintf(stderr, "%s: %.*s\n", name, static_cast<int>(text.size()), text.data());
    }
};

template <typename Kind>
Bytes bytesOf(const Kind& content) {
    Bytes bytes(sizeof(content));
    std::memcpy(bytes.data(), &content, sizeof(content));
    return bytes;
}

class KSTDValueTypeTest : public testing::Test {
  protected:
    KSTDValueType type(std::string_view encoding) {
        return KSTDValueType::typeForEncoding(encoding, log);
    }

    template <typename Kind>
    void expectBoxed(std::string_view encoding, std::vector<Kind> contents) {
        SCOPED_TRACE(encoding);
        for (const Kind content : contents) {
            EXPECT_EQ(type(encoding).objectWithBytes(bytesOf(content), log), Value(content));
        }
    }

    template <typename Kind>
    void expectLimitsBoxed(std::string_view encoding) {
        using Limits = std::numeric_limits<Kind>;
        expectBoxed<Kind>(encoding, {Limits::lowest(), Limits::max(), Kind{0}, Kind{1}});
    }

    platform::FakeSystemLog log;
};

struct Row {
    std::uint64_t code;
    std::string_view encoding;
    std::string_view name;
    std::uint64_t size;
    std::uint64_t flags;
};

void expectRow(const KSTDValueType& type, const Row& row) {
    SCOPED_TRACE(row.encoding);
    EXPECT_EQ(type.code(), row.code);
    EXPECT_EQ(type.encoding(), row.encoding);
    EXPECT_EQ(type.name(), row.name);
    EXPECT_EQ(type.size(), row.size);
    EXPECT_EQ(type.flags(), row.flags);
    EXPECT_EQ(type.className(), std::nullopt);
    EXPECT_EQ(type.isNumber(), row.flags != 0);
    EXPECT_EQ(type.isIntegerNumber(), row.flags == 1);
    EXPECT_EQ(type.isFloatingPointNumber(), row.flags == 2);
    EXPECT_EQ(type.isObject(), row.code == 15);
}

TEST_F(KSTDValueTypeTest, ScalarTypes) {
    const Row rows[] = {
        {0, "c", "char", 1, 1},
        {1, "s", "short", 2, 1},
        {2, "i", "int", 4, 1},
        {3, "l", "long", 8, 1},
        {4, "q", "long long", 8, 1},
        {5, "C", "unsigned char", 1, 1},
        {6, "S", "unsigned short", 2, 1},
        {7, "I", "unsigned int", 4, 1},
        {8, "L", "unsigned long", 8, 1},
        {9, "Q", "unsigned long long", 8, 1},
        {10, "f", "float", 4, 2},
        {11, "d", "double", 8, 2},
        {12, "B", "bool", 1, 1},
        {13, "v", "void", 1, 0},
        {14, "*", "char*", 8, 0},
        {15, "@", "id", 8, 0},
        {16, "#", "Class", 8, 0},
    };
    for (const Row& row : rows) {
        expectRow(type(row.encoding), row);
    }
}

TEST_F(KSTDValueTypeTest, OnlyTheFirstCharacterOfAScalarCounts) {
    EXPECT_EQ(type("cx").encoding(), "c");
    EXPECT_EQ(type("@?").encoding(), "@");
    EXPECT_EQ(type("#:").encoding(), "#");
}

TEST_F(KSTDValueTypeTest, OtherTypesKeepTheirWholeCode) {
    const Row rows[] = {
        {18, "[", "array", 0, 0},      {18, "[12i]", "array", 0, 0},
        {19, "{", "structure", 0, 0},  {19, "{point=ii}", "structure", 0, 0},
        {20, "(", "union", 0, 0},      {20, "(u=if)", "union", 0, 0},
        {21, "b", "bitfield", 0, 0},   {21, "b3", "bitfield", 0, 0},
        {22, "^", "pointer", 8, 0},    {22, "^i", "pointer", 8, 0},
        {23, "?", "unknown", 0, 0},    {23, "ri", "unknown", 0, 0},
        {23, "", "unknown", 0, 0},     {23, "\"@\"", "unknown", 0, 0},
        {23, "\xff", "unknown", 0, 0},
    };
    for (const Row& row : rows) {
        expectRow(type(row.encoding), row);
    }
}

TEST_F(KSTDValueTypeTest, AQuotedClassNameMakesAnObjectOfThatClass) {
    for (const std::string_view className : {"A", "String", "a\"b"}) {
        const std::string encoding = "@\"" + std::string(className) + "\"";
        const KSTDValueType object = type(encoding);
        EXPECT_EQ(object.className(), className);
        EXPECT_EQ(object.encoding(), encoding);
        EXPECT_EQ(object.code(), 15U);
        EXPECT_EQ(object.name(), "id");
        EXPECT_EQ(object.size(), 8U);
        EXPECT_EQ(object.flags(), 0U);
        EXPECT_TRUE(object.isObject());
    }
}

TEST_F(KSTDValueTypeTest, AnIncompleteClassNameIsNone) {
    for (const std::string_view encoding :
         {"@\"", "@\"\"", "@\"A", "@A\"", "@'A'", "@\"A\"x", "@xA\""}) {
        expectRow(type(encoding), {15, "@", "id", 8, 0});
    }
}

TEST_F(KSTDValueTypeTest, ValuesHaveTheTypeOfTheirKind) {
    const std::pair<Value, std::string_view> values[] = {
        {true, "B"},
        {std::int8_t{1}, "c"},
        {std::int16_t{1}, "s"},
        {std::int32_t{1}, "i"},
        {std::int64_t{1}, "q"},
        {std::uint8_t{1}, "C"},
        {std::uint16_t{1}, "S"},
        {std::uint32_t{1}, "I"},
        {std::uint64_t{1}, "Q"},
        {1.0F, "f"},
        {1.0, "d"},
        {platform::Null(), "@"},
        {"text", "@"},
        {Bytes{1}, "@"},
        {platform::Timestamp{1}, "@"},
        {platform::UniqueIdentifier(), "@"},
        {platform::Link{"a:b"}, "@"},
        {platform::Error(), "@"},
        {platform::ValueList(), "@"},
        {platform::ValueMap(), "@"},
    };
    for (const auto& [value, encoding] : values) {
        EXPECT_EQ(KSTDValueType::typeForValue(value).encoding(), encoding);
    }
}

TEST_F(KSTDValueTypeTest, NumbersAreBoxedAsExactlyTheirType) {
    expectLimitsBoxed<std::int8_t>("c");
    expectLimitsBoxed<std::int16_t>("s");
    expectLimitsBoxed<std::int32_t>("i");
    expectLimitsBoxed<std::int64_t>("l");
    expectLimitsBoxed<std::int64_t>("q");
    expectLimitsBoxed<std::uint8_t>("C");
    expectLimitsBoxed<std::uint16_t>("S");
    expectLimitsBoxed<std::uint32_t>("I");
    expectLimitsBoxed<std::uint64_t>("L");
    expectLimitsBoxed<std::uint64_t>("Q");
    expectLimitsBoxed<float>("f");
    expectLimitsBoxed<double>("d");
    expectBoxed<bool>("B", {false, true});
    // Any byte that is not 0 is true.
    EXPECT_EQ(type("B").objectWithBytes(Bytes{2}, log), Value(true));
}

TEST_F(KSTDValueTypeTest, BytesBehindTheNumberAreIgnored) {
    EXPECT_EQ(type("C").objectWithBytes(Bytes{7, 9}, log), Value(std::uint8_t{7}));
}

TEST_F(KSTDValueTypeTest, AnObjectIsWhatThePointerPointsTo) {
    const Value value("text");
    const Value* pointer = &value;
    EXPECT_EQ(type("@").objectWithBytes(bytesOf(pointer), log), value);
    EXPECT_EQ(type("@\"String\"").objectWithBytes(bytesOf(pointer), log), value);
    pointer = nullptr;
    EXPECT_EQ(type("@").objectWithBytes(bytesOf(pointer), log), Value());
}

TEST_F(KSTDValueTypeTest, BytesOfANumberAreBoxedToItAgain) {
    const Value values[] = {
        true,
        std::int8_t{-2},
        std::int16_t{-3},
        std::int32_t{-4},
        std::int64_t{-5},
        std::uint8_t{200},
        std::uint16_t{65535},
        std::uint32_t{4294967295U},
        std::uint64_t{18446744073709551615U},
        0.1F,
        0.1,
    };
    for (const Value& value : values) {
        const KSTDValueType& ownType = KSTDValueType::typeForValue(value);
        Bytes bytes(20, 0xee);
        ownType.getBytes(bytes, value, log);
        EXPECT_EQ(bytes.size(), ownType.size());
        EXPECT_EQ(ownType.objectWithBytes(bytes, log), value);
    }
    EXPECT_TRUE(log.texts().empty());
}

TEST_F(KSTDValueTypeTest, TheBytesAreThoseOfTheNumbersOwnKind) {
    Bytes bytes;
    type("d").getBytes(bytes, std::int16_t{0x0102}, log);
    EXPECT_EQ(bytes, bytesOf(std::int16_t{0x0102}));
}

TEST_F(KSTDValueTypeTest, TheTableIsOneForAllThreads) {
    std::vector<const KSTDValueType*> found(4);
    std::vector<std::thread> threads;
    for (const KSTDValueType*& each : found) {
        threads.emplace_back([&each] { each = &KSTDValueType::typeForValue(1.0); });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(found, std::vector(4, &KSTDValueType::typeForValue(2.0)));
}

class KSTDValueTypeDeathTest : public testing::Test {
  protected:
    KSTDValueType type(std::string_view encoding) {
        return KSTDValueType::typeForEncoding(encoding, log);
    }

    StandardErrorLog log;
    const testing::KilledBySignal aborted = testing::KilledBySignal(SIGABRT);
};

TEST_F(KSTDValueTypeDeathTest, TheSelectorCodeIsOutOfRange) {
    const char line[] = "^error: KSTDValueType: index 17 is out of range, there are 17 types\n$";
    EXPECT_EXIT(type(":"), aborted, line);
    EXPECT_EXIT(type(":i"), aborted, line);
}

TEST_F(KSTDValueTypeDeathTest, OtherTypesAreNotBoxed) {
    const std::pair<std::string_view, std::string> names[] = {
        {"v", "void"},      {"\\*", "char\\*"},    {"#", "Class"},
        {"[2i]", "array"},  {"{p=}", "structure"}, {"(u=)", "union"},
        {"b3", "bitfield"}, {"^i", "pointer"},     {"?", "unknown"},
    };
    for (const auto& [encoding, name] : names) {
        const std::string_view code = encoding == "\\*" ? "*" : encoding;
        const std::string line =
            "^error: For class KSTDValueType, Unsupported boxing type: " + name + "\n$";
        EXPECT_EXIT(static_cast<void>(type(code).objectWithBytes(Bytes(8), log)), aborted, line);
        EXPECT_EXIT(static_cast<void>(type(code).objectWithBytes({}, log)), aborted, line);
    }
}

TEST_F(KSTDValueTypeDeathTest, TooFewBytesAreNotBoxed) {
    EXPECT_EXIT(static_cast<void>(type("q").objectWithBytes(Bytes(7), log)), aborted,
                "^error: KSTDValueType: 7 bytes are too few for long long\n$");
    EXPECT_EXIT(static_cast<void>(type("c").objectWithBytes({}, log)), aborted,
                "^error: KSTDValueType: 0 bytes are too few for char\n$");
}

TEST_F(KSTDValueTypeDeathTest, OnlyNumbersHaveBytes) {
    Bytes bytes;
    EXPECT_EXIT(type("q").getBytes(bytes, "text", log), aborted,
                "^error: Unsupported unboxing type: long long\n$");
    EXPECT_EXIT(type("@").getBytes(bytes, Value(), log), aborted,
                "^error: Unsupported unboxing type: id\n$");
}

} // namespace
} // namespace kstd
