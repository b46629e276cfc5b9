#include "kstctl/Forms.h"

#include <gtest/gtest.h>

#include <limits>

namespace kstctl {
namespace {

Report everyKind() {
    Report inner;
    inner.add("deep", Report().add("deeper", Data{1, 2}));
    Report report;
    report.add("none", Report::None())
        .add("unknown", Report::Unknown{"not\nsaid"})
        .add("yes", true)
        .add("negative", -7)
        .add("largest", std::numeric_limits<std::uint64_t>::max())
        .add("real", 0.5)
        .add("whole", 3.0)
        .add("text", "a\x1b[b")
        .add("meant", 1, "one\t")
        .add("inner", std::move(inner))
        .add("list", Data{Report().add("a", 1).add("b", Data{}), Report(), "x"})
        .add("emptyList", Data{})
        .add("emptyReport", Report(), "why");
    return report;
}

TEST(FormsTest, ReportAsText) {
    EXPECT_EQ(textForm(everyKind(), Colours::no), "none: none\n"
                                                  "unknown: unknown: not\\nsaid\n"
                                                  "yes: yes\n"
                                                  "negative: -7\n"
                                                  "largest: 18446744073709551615\n"
                                                  "real: 0.5\n"
                                                  "whole: 3\n"
                                                  "text: a\\x1b[b\n"
                                                  "meant: 1 (one\\t)\n"
                                                  "inner:\n"
                                                  "  deep:\n"
                                                  "    deeper:\n"
                                                  "      - 1\n"
                                                  "      - 2\n"
                                                  "list:\n"
                                                  "  - a: 1\n"
                                                  "    b: none\n"
                                                  "  - none\n"
                                                  "  - x\n"
                                                  "emptyList: none\n"
                                                  "emptyReport: none (why)\n");
    EXPECT_EQ(textForm(Report(), Colours::no), "");
}

TEST(FormsTest, ReportAsJSON) {
    EXPECT_EQ(JSONForm(everyKind()),
              R"({"none":null,"unknown":null,"unknownUnknown":"not\nsaid","yes":true,)"
              R"("negative":-7,"largest":18446744073709551615,"real":0.5,"whole":3.0,)"
              R"("text":"a\u001B[b","meant":1,"meantText":"one\t",)"
              R"("inner":{"deep":{"deeper":[1,2]}},"list":[{"a":1,"b":[]},{},"x"],)"
              R"("emptyList":[],"emptyReport":{},"emptyReportText":"why"})"
              "\n");
    EXPECT_EQ(JSONForm(Report()), "{}\n");
}

TEST(FormsTest, WhatJSONCannotExpressKeepsItsKey) {
    Report report;
    report.add("bytes", std::string("a\xff"))
        .add("zero", std::string("a\0b", 3))
        .add("endless", std::numeric_limits<double>::infinity())
        .add("noNumber", std::numeric_limits<double>::quiet_NaN());
    EXPECT_EQ(JSONForm(report),
              R"({"bytes":"a\\xff","zero":"a\\x00b","endless":null,"noNumber":null})"
              "\n");
}

TEST(FormsTest, ColoursAreAroundNamesAndUnknowns) {
    Report report;
    report.add("a", 1).add("b", Report::Unknown{"why"});
    EXPECT_EQ(textForm(report, Colours::yes),
              "\x1b[1ma:\x1b[0m 1\n\x1b[1mb:\x1b[0m \x1b[33munknown: why\x1b[0m\n");
}

/// The whole of a table for a terminal of that width.
std::string tableOf(const Row& headings, const std::vector<Row>& rows,
                    std::optional<std::size_t> room = {}, Colours colours = Colours::no) {
    Table table(headings, room);
    for (const Row& row : rows) {
        table.measure(row);
    }
    std::string text = table.headingLines(colours);
    for (const Row& row : rows) {
        text += table.lines(row);
    }
    return text;
}

TEST(FormsTest, TableAsText) {
    const Row headings{"ID", "NAME", "REST"};
    const std::vector<Row> rows{{"1", "äöü", "x"}, {"100", "", "a\tb"}, {"2", "b", ""}};
    EXPECT_EQ(tableOf(headings, rows), "ID   NAME  REST\n"
                                       "1    äöü   x\n"
                                       "100        a\\tb\n"
                                       "2    b\n");
    EXPECT_EQ(tableOf({"A"}, {}, {}, Colours::yes), "\x1b[1mA\x1b[0m\n");
    EXPECT_EQ(tabbedLine(headings), "ID\tNAME\tREST\n");
    EXPECT_EQ(tabbedLine(rows[1]), "100\t\ta\\tb\n");
    EXPECT_EQ(tabbedLine(rows[2]), "2\tb\t\n");
    EXPECT_EQ(tabbedLine({"", "x"}), "\tx\n");
}

TEST(FormsTest, TableOnANarrowTerminal) {
    const Row headings{"ID", "NAME", "REST"};
    const std::vector<Row> rows{{"1", "12345678", "ä b c d e f g h i j k"}, {"22", "x", ""}};
    const std::string wide = "ID  NAME      REST\n"
                             "1   12345678  ä b c d e f g h i j k\n"
                             "22  x\n";
    EXPECT_EQ(tableOf(headings, rows, 36), wide);
    EXPECT_EQ(tableOf(headings, rows, 35), wide);
    EXPECT_EQ(tableOf(headings, rows, 34), "ID  NAME\n"
                                           "  REST\n"
                                           "1   12345678\n"
                                           "  ä b c d e f g h i j k\n"
                                           "22  x\n");
    EXPECT_EQ(tableOf(headings, rows, 22), "ID  NAME\n"
                                           "  REST\n"
                                           "1   12345678\n"
                                           "  ä b c d e f g h i j\n"
                                           "  k\n"
                                           "22  x\n");
    // No terminal is narrower than twenty characters; what has no blank is cut anywhere.
    const std::string digits(40, '7');
    for (const std::size_t room : {1U, 19U, 20U}) {
        EXPECT_EQ(tableOf({"A", "B"}, {{digits, "ö"}}, room),
                  "  A\n  B\n  " + std::string(18, '7') + "\n  " + std::string(18, '7') +
                      "\n  7777\n  ö\n");
    }
    EXPECT_EQ(tableOf({"A", "B"}, {{"1", "äöüäöüäöüäöüäöüäöüä"}}, 20),
              "A\n  B\n1\n  äöüäöüäöüäöüäöüäöü\n  ä\n");
}

TEST(FormsTest, ListOfJSONInPieces) {
    JSONListForm form(Report().add("a", 1).add("b", Report::None(), "x"), "c");
    // One after the other: the form knows which element is the first.
    std::string text = form.start();
    text += form.element(Report().add("d", 1));
    text += form.element(Report());
    EXPECT_EQ(text + JSONListForm::end(), R"({"a":1,"b":null,"bText":"x","c":[{"d":1},{}]})"
                                          "\n");
    EXPECT_EQ(JSONListForm(Report(), "c").start() + JSONListForm::end(), "{\"c\":[]}\n");
    EXPECT_EQ(JSONTextForm("a\"\n\xc2\x9b"), "a\\\"\\n\\u009b");
    EXPECT_EQ(JSONTextForm(""), "");
}

} // namespace
} // namespace kstctl
