#pragma once

#include "tests/support/RecordingLog.h"

#include <regex>
#include <string>
#include <string_view>
#include <vector>

namespace support {

/// The texts of a log with the line number of each assertion line replaced by <n>, so that all else
/// can be compared exactly.
[[nodiscard]] inline std::vector<std::string> textsWithoutLineNumbers(const RecordingLog& log) {
    static const std::regex kLineNumber(R"(^(.*: AssertMacros: .* file: [^:]+:)[1-9][0-9]*\n$)");
    std::vector<std::string> texts;
    for (const std::string& text : log.texts()) {
        texts.push_back(std::regex_replace(text, kLineNumber, "$1<n>\n"));
    }
    return texts;
}

} // namespace support
