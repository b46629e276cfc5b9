// The walks that the document on the architecture shows file by file: they go through the files
// that are there, and each file knows the next one.

#include <gtest/gtest.h>

#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

/// One line of a walk: a file, and a name that both it and the file that leads to it hold.
struct Step {
    std::size_t depth = 0;
    std::string file;
    std::string name;
};

struct Walk {
    /// As the heading says.
    std::size_t files = 0;
    std::vector<Step> steps;
};

/// "### title: n files", then a block of steps, two blanks deeper for each file on the way there.
std::map<std::string, Walk> readWalks(std::istream& document) {
    const std::string start = "### ";
    std::map<std::string, Walk> walks;
    Walk* walk = nullptr;
    bool isInBlock = false;
    for (std::string line; std::getline(document, line);) {
        const std::size_t colon = line.find(": ");
        if (line.rfind(start, 0) == 0 && colon != std::string::npos) {
            walk = &walks[line.substr(start.size(), colon - start.size())];
            std::istringstream(line.substr(colon + 1)) >> walk->files;
        } else if (line == "```") {
            isInBlock = !isInBlock;
            walk = isInBlock ? walk : nullptr;
        } else if (isInBlock && walk != nullptr) {
            Step step;
            step.depth = line.find_first_not_of(' ') / 2;
            std::istringstream(line) >> step.file >> step.name;
            walk->steps.push_back(step);
        }
    }
    return walks;
}

std::map<std::string, Walk> walksOfDocument() {
    std::ifstream document(fs::path(SOURCE_ROOT) / "docs/architecture.md");
    return readWalks(document);
}

bool isWordCharacter(char character) {
    return std::isalnum(static_cast<unsigned char>(character)) != 0 || character == '_';
}

/// Whether the file holds the name as a whole word.
bool holds(const std::string& file, const std::string& name) {
    std::ifstream stream(fs::path(SOURCE_ROOT) / file);
    const std::string text{std::istreambuf_iterator<char>(stream), {}};
    for (std::size_t at = text.find(name); at != std::string::npos; at = text.find(name, at + 1)) {
        const std::size_t end = at + name.size();
        if ((at == 0 || !isWordCharacter(text[at - 1])) &&
            (end == text.size() || !isWordCharacter(text[end]))) {
            return true;
        }
    }
    return false;
}

/// What is wrong with the steps of a walk.
std::vector<std::string> faultsOf(const Walk& walk) {
    std::vector<std::string> faults;
    std::set<std::string> files;
    std::vector<std::string> way;
    for (const Step& step : walk.steps) {
        files.insert(step.file);
        if (step.depth > way.size() || (step.depth == 0) != way.empty()) {
            faults.push_back(step.file + " is reached from nowhere");
            return faults;
        }
        way.resize(step.depth);
        if (step.name.empty() || !holds(step.file, step.name)) {
            faults.push_back(step.file + " does not hold " + step.name);
        }
        if (!way.empty() && !holds(way.back(), step.name)) {
            faults.push_back(way.back() + " does not know " + step.file + " by " + step.name);
        }
        way.push_back(step.file);
    }
    if (files.size() != walk.files) {
        faults.push_back("these are " + std::to_string(files.size()) + " files");
    }
    return faults;
}

TEST(WalksTest, EachFileKnowsTheNextOne) {
    const auto walks = walksOfDocument();
    EXPECT_EQ(walks.size(), 3U);
    for (const auto& [title, walk] : walks) {
        for (const std::string& fault : faultsOf(walk)) {
            ADD_FAILURE() << title << ": " << fault;
        }
    }
}

TEST(WalksTest, NoneIsLongerThanItShouldBe) {
    const std::map<std::string, std::size_t> limits = {
        {"One notification", 24}, {"One policy question", 22}, {"One event", 28}};
    for (const auto& [title, walk] : walksOfDocument()) {
        const auto limit = limits.find(title);
        ASSERT_NE(limit, limits.end()) << title;
        EXPECT_LE(walk.files, limit->second) << title;
    }
}

TEST(WalksTest, WhatIsNoWalkIsFound) {
    const std::vector<std::string> walks = {
        // No such file, a name that is not there, one that only the further file holds.
        "```\nkstd/main.cpp  main\n  kstd/Nowhere.cpp  main\n```\n",
        "```\nkstd/main.cpp  nowhere\n  kstd/Daemon.cpp  Daemon\n```\n",
        "```\nkstd/main.cpp  main\n  kstd/Daemon.cpp  startServices\n```\n",
        // A part of a word, a step too far, two beginnings, another number of files.
        "```\nkstd/main.cpp  main\n  kstd/Daemon.cpp  Daem\n```\n",
        "```\nkstd/main.cpp  main\n    kstd/Daemon.cpp  Daemon\n```\n",
        "```\nkstd/main.cpp  main\nkstd/Daemon.cpp  Daemon\n```\n",
        "```\nkstd/main.cpp  main\n```\n",
    };
    for (const std::string& block : walks) {
        std::istringstream document("### Any: 2 files\n\n" + block);
        EXPECT_FALSE(faultsOf(readWalks(document)["Any"]).empty()) << block;
    }
    std::istringstream document(
        "### Any: 2 files\n\n```\nkstd/main.cpp  main\n  kstd/Daemon.cpp  Daemon\n```\n");
    EXPECT_TRUE(faultsOf(readWalks(document)["Any"]).empty());
}

} // namespace
