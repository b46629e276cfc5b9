#pragma once

#include "keystrand-sim/ControlArguments.h"
#include "tests/keystrand/Bytes.h"

#include <gtest/gtest.h>

#include <fstream>
#include <map>
#include <string>
#include <vector>

namespace keystrand::sim::test {

using namespace keystrand::test;

/// The lines of a block as bytes; 16 on every line but the last.
inline ByteVector bytesOf(const std::vector<std::string>& lines) {
    ByteVector bytes;
    for (const std::string& line : lines) {
        EXPECT_TRUE(&line == &lines.back() ? line.size() <= 32 : line.size() == 32) << line;
        const auto some = fromHexWord(line);
        EXPECT_TRUE(some) << line;
        bytes.insert(bytes.end(), some->begin(), some->end());
    }
    return bytes;
}

/// The blocks of the document by their names. All of them must have one.
inline std::map<std::string, ByteVector> readExamples(const char* path) {
    const std::string mark = "```";
    std::map<std::string, ByteVector> examples;
    std::ifstream document(path);
    for (std::string line; std::getline(document, line);) {
        if (line.rfind(mark, 0) != 0) {
            continue;
        }
        EXPECT_EQ(line.rfind("```bytes ", 0), 0U) << line;
        const std::string name = line.substr(line.find(' ') + 1);
        std::vector<std::string> lines;
        while (std::getline(document, line) && line != mark) {
            lines.push_back(line);
        }
        EXPECT_TRUE(examples.emplace(name, bytesOf(lines)).second) << name << " twice";
    }
    return examples;
}

} // namespace keystrand::sim::test
