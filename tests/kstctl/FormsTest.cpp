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

TEST(FormsTest, TableAsText) {
    const Table table{.headings = {"ID", "NAME", "REST"},
                      .rows = {{"1", "äöü", "x"}, {"100", "", "a\tb"}, {"2", "b", ""}}};
    EXPECT_EQ(textForm(table, Colours::no), "ID   NAME  REST\n"
                                            "1    äöü   x\n"
                                            "100        a\\tb\n"
                                            "2    b\n");
    EXPECT_EQ(textForm(Table{.headings = {"A"}, .rows = {}}, Colours::yes), "\x1b[1mA\x1b[0m\n");
    EXPECT_EQ(tabbedForm(table), "ID\tNAME\tREST\n1\täöü\tx\n100\t\ta\\tb\n2\tb\t\n");
}

} // namespace
} // namespace kstctl
