// The tables of the pages against the tables of the code.

#include "base/Concat.h"
#include "wire/CommandTable.h"
#include "wire/RestrictedMode.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <vector>

namespace wire {

namespace {

using testing::HasSubstr;

std::string page(const std::string& name) {
    std::ifstream file(std::string(PAGES "/") + name);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// The cells of the rows below the header that begins with `header`, without the blanks that align
/// them.
std::vector<std::vector<std::string>> tableBelow(const std::string& text,
                                                 const std::string& header) {
    std::istringstream lines(text.substr(std::min(text.find("\n" + header), text.size())));
    std::vector<std::vector<std::string>> rows;
    std::string line;
    std::getline(lines, line);
    std::getline(lines, line);
    std::getline(lines, line);
    while (std::getline(lines, line) && !line.empty() && line.front() == '|') {
        std::vector<std::string> cells;
        std::istringstream cut(line.substr(1));
        for (std::string cell; std::getline(cut, cell, '|');) {
            cell.erase(0, cell.find_first_not_of(' '));
            cell.erase(cell.find_last_not_of(' ') + 1);
            cells.push_back(cell);
        }
        rows.push_back(cells);
    }
    return rows;
}

TEST(TablesInPagesTest, WireFormatsListsTheCommandsAsTheyAre) {
    std::vector<std::vector<std::string>> wanted;
    for (const CommandKind& kind : kCommandKinds) {
        wanted.push_back(
            {base::concat(kind.code), kind.title, kind.payload, base::concat(kind.replyOffered)});
    }
    EXPECT_EQ(tableBelow(page("docs/wire-formats.md"), "| code | command"), wanted);
}

TEST(TablesInPagesTest, EachCommandIsFoundByItsCode) {
    std::uint32_t last = 0;
    for (const CommandKind& kind : kCommandKinds) {
        EXPECT_EQ(findCommandKind(kind.code), &kind);
        last = std::max<std::uint32_t>(last, kind.code);
    }
    EXPECT_EQ(findCommandKind(0), nullptr);
    EXPECT_EQ(findCommandKind(last + 1), nullptr);
}

TEST(TablesInPagesTest, KernelSocketListsTheCommandsByTheSameNames) {
    std::vector<std::string> wanted;
    for (const CommandKind& kind : kCommandKinds) {
        wanted.push_back(base::concat(kind.code, ' ', kind.title));
    }
    std::vector<std::string> found;
    for (const auto& row : tableBelow(page("docs/kernel-socket.md"), "| code | command")) {
        found.push_back(row.at(0) + " " + row.at(1));
    }
    EXPECT_EQ(found, wanted);
}

TEST(TablesInPagesTest, TheToolsPageListsTheCommandsByTheNamesThatItTakes) {
    for (const CommandKind& kind : kCommandKinds) {
        EXPECT_THAT(page("docs/kstctl.md"), HasSubstr(base::concat('`', kind.name, '`')));
    }
}

TEST(TablesInPagesTest, EveryNotificationStandsOnEveryPageThatListsThem) {
    for (const rm::NotificationKind& kind : rm::kNotificationKinds) {
        SCOPED_TRACE(kind.property);
        const std::string event = base::concat(rm::kNotificationNamePrefix, kind.property);
        const std::string quoted = base::concat('`', kind.property, '`');
        EXPECT_THAT(page("docs/kernel-socket.md"),
                    HasSubstr(base::concat("|    ", std::uint32_t{kind.type}, " | ", quoted)));
        EXPECT_THAT(page("man/kstctl.1"), HasSubstr(base::concat(kind.shortName, " Ta ", event)));
        EXPECT_THAT(page("man/keystrand-sim.8"),
                    HasSubstr(base::concat("publish ", kind.shortName)));
    }
}

} // namespace

} // namespace wire
