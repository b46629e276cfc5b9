#include "common/Failure.h"
#include "tests/support/AssertionLines.h"
#include "tests/support/RecordingLog.h"

#include <gtest/gtest.h>

#include <limits>

namespace {

using support::RecordingLog;

} // namespace

TEST(AssertLine, ExactTextAndPlace) {
    RecordingLog log;
    const kst::AssertionContext context{&log, "KSTLib", "KSTLib/KSTLib"};
    EXPECT_EQ(kst::fail(context, "service", 0, kKSTErrorUnexpected, {"KSTLib/Channel.cpp", 123}),
              -5);
    ASSERT_EQ(log.lines().size(), 1U);
    const RecordingLog::Line& line = log.lines().front();
    EXPECT_EQ(line.text, "KSTLib: AssertMacros: service (value: 0x0),  file: KSTLib/KSTLib:123\n");
    EXPECT_EQ(line.level, platform::LogLevel::info);
    EXPECT_EQ(line.file, "KSTLib/Channel.cpp");
    EXPECT_EQ(line.line, 123);
    EXPECT_EQ(line.function, "");
}

TEST(AssertLine, NamesTheSourceAndTheLineOfTheCheck) {
    RecordingLog log;
    const kst::AssertionContext context{&log, "kstd", "kstd/main"};
    const int here = __LINE__ + 1;
    EXPECT_EQ(kst::fail(context, "0", 0, kKSTErrorBadParameter), -3);
    EXPECT_EQ(kst::failCall(context, -7), -7);
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].file, "tests/common/AssertLineTest.cpp");
    EXPECT_EQ(log.lines()[0].line, here);
    EXPECT_EQ(log.lines()[1].line, here + 1);
    EXPECT_EQ(log.texts()[0], "kstd: AssertMacros: 0 (value: 0x0),  file: kstd/main:" +
                                  std::to_string(here) + "\n");
}

TEST(AssertLine, FirstArgumentThatIsNullIsNamedWithItsOwnLine) {
    RecordingLog log;
    const kst::AssertionContext context{&log, "KST", "common/LibSerialization"};
    const int there = 0;
    const auto require = [&](const int* first, const int* second) {
        return kst::requireArguments(context, {
                                                  kst::Argument(first, "first"),
                                                  kst::Argument(second, "second"),
                                              });
    };
    EXPECT_EQ(require(&there, &there), 0);
    EXPECT_EQ(require(nullptr, nullptr), -3);
    EXPECT_EQ(require(&there, nullptr), -3);
    const int line = __LINE__ - 7;
    ASSERT_EQ(log.lines().size(), 2U);
    EXPECT_EQ(log.lines()[0].line, line);
    EXPECT_EQ(log.lines()[1].line, line + 1);
    EXPECT_EQ(log.lines()[1].file, "tests/common/AssertLineTest.cpp");
    EXPECT_EQ(support::textsWithoutLineNumbers(log),
              (std::vector<std::string>{
                  "KST: AssertMacros: first (value: 0x0),  file: common/LibSerialization:<n>\n",
                  "KST: AssertMacros: second (value: 0x0),  file: common/LibSerialization:<n>\n"}));
}

TEST(AssertLine, FailedCallShowsItsStatusSignExtended) {
    RecordingLog log;
    const kst::AssertionContext context{&log, "kstd", "a/b"};
    EXPECT_EQ(kst::failCall(context, -5, {"x", 1}), -5);
    EXPECT_EQ(kst::failCall(context, 1, {"x", 2}), 1);
    EXPECT_EQ(kst::failCall(context, std::numeric_limits<std::int32_t>::min(), {"x", 3}),
              std::numeric_limits<std::int32_t>::min());
    EXPECT_EQ(kst::failCall(context, std::numeric_limits<std::int32_t>::max(), {"x", 4}),
              std::numeric_limits<std::int32_t>::max());
    EXPECT_EQ(log.texts(),
              (std::vector<std::string>{
                  "kstd: AssertMacros: err == 0  (value: 0xfffffffffffffffb),  file: a/b:1\n",
                  "kstd: AssertMacros: err == 0  (value: 0x1),  file: a/b:2\n",
                  "kstd: AssertMacros: err == 0  (value: 0xffffffff80000000),  file: a/b:3\n",
                  "kstd: AssertMacros: err == 0  (value: 0x7fffffff),  file: a/b:4\n"}));
}

TEST(AssertLine, ValueAndStatusMayDiffer) {
    RecordingLog log;
    const kst::AssertionContext context{&log, "kstd", "a/b"};
    EXPECT_EQ(kst::fail(context, "ferr == 0 ", std::numeric_limits<std::int64_t>::min(),
                        kKSTErrorUnexpected, {"x", 9}),
              -5);
    EXPECT_EQ(log.texts().front(),
              "kstd: AssertMacros: ferr == 0  (value: 0x8000000000000000),  file: a/b:9\n");
}

TEST(AssertLine, TheTextIsNoFormat) {
    RecordingLog log;
    EXPECT_EQ(kst::fail({&log, "%s", "%d"}, "%n%s", 0, -3, {"x", 5}), -3);
    EXPECT_EQ(log.texts().front(), "%s: AssertMacros: %n%s (value: 0x0),  file: %d:5\n");
}

TEST(AssertLine, WithoutALogOnlyTheStatusComesBack) {
    EXPECT_EQ(kst::fail({nullptr, "KST", "common/LibCall"}, "transport", 0, -3), -3);
}

TEST(AssertLine, LineNumbersAreReplacedForComparison) {
    RecordingLog log;
    EXPECT_EQ(kst::fail({&log, "kstd", "a/b"}, "x: y", 0, -3), -3);
    log.write(platform::LogLevel::info, "kstd: main: file: a/b:12\n", {});
    EXPECT_EQ(support::textsWithoutLineNumbers(log),
              (std::vector<std::string>{"kstd: AssertMacros: x: y (value: 0x0),  file: a/b:<n>\n",
                                        "kstd: main: file: a/b:12\n"}));
}
