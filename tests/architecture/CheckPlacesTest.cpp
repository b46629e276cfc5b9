// Where the checks are that write assertion lines: a line number and a source name one of them.

#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

constexpr std::string_view kDefault = "CheckPlace::here()";

bool isWordCharacter(char character) {
    return std::isalnum(static_cast<unsigned char>(character)) != 0 || character == '_';
}

/// The code with comments and what stands in quotes as blanks.
std::string codeOf(std::string text) {
    for (std::size_t i = 0; i < text.size(); ++i) {
        std::size_t end = i;
        if (text.compare(i, 2, "//") == 0) {
            end = text.find('\n', i);
        } else if (text.compare(i, 2, "/*") == 0) {
            end = text.find("*/", i);
        } else if (text[i] == '"' ||
                   (text[i] == '\'' && (i == 0 || !isWordCharacter(text[i - 1])))) {
            end = i + 1;
            while (end < text.size() && text[end] != text[i]) {
                end += text[end] == '\\' ? 2U : 1U;
            }
        }
        end = std::min(end, text.size());
        for (; i < end; ++i) {
            text[i] = text[i] == '\n' ? '\n' : ' ';
        }
    }
    return text;
}

std::size_t lineAt(const std::string& code, std::size_t offset) {
    return 1 + static_cast<std::size_t>(std::count(
                   code.begin(), code.begin() + static_cast<std::ptrdiff_t>(offset), '\n'));
}

/// Where the bracket that stands at `open` is closed.
std::size_t closeOf(const std::string& code, std::size_t open) {
    const char opening = code[open];
    const char closing = opening == '(' ? ')' : '}';
    std::size_t depth = 0;
    for (std::size_t i = open; i < code.size(); ++i) {
        depth += code[i] == opening ? 1U : 0U;
        if (code[i] == closing && --depth == 0) {
            return i;
        }
    }
    return code.size();
}

/// Where the parameters begin among which `offset` is.
std::size_t openBefore(const std::string& code, std::size_t offset) {
    std::size_t depth = 1;
    while (offset > 0 && depth > 0) {
        --offset;
        depth += code[offset] == ')' ? 1U : 0U;
        depth -= code[offset] == '(' ? 1U : 0U;
    }
    return offset;
}

std::string wordBefore(const std::string& code, std::size_t offset) {
    std::size_t begin = offset;
    while (begin > 0 && isWordCharacter(code[begin - 1])) {
        --begin;
    }
    return code.substr(begin, offset - begin);
}

bool hasWord(const std::string& code, const std::string& word) {
    for (std::size_t at = code.find(word); at != std::string::npos; at = code.find(word, at + 1)) {
        if ((at == 0 || !isWordCharacter(code[at - 1])) &&
            !isWordCharacter(code[at + word.size()])) {
            return true;
        }
    }
    return false;
}

/// The functions that take the place of a check from where they are called.
std::set<std::string> checksDeclaredIn(const std::string& code) {
    std::set<std::string> names;
    for (std::size_t at = code.find(kDefault); at != std::string::npos;
         at = code.find(kDefault, at + 1)) {
        names.insert(wordBefore(code, openBefore(code, at)));
    }
    return names;
}

struct Call {
    std::string name;
    std::size_t line;
    /// Between the brackets.
    std::string arguments;
    std::size_t end;
};

std::vector<Call> callsIn(const std::string& code, const std::set<std::string>& names) {
    std::vector<Call> calls;
    for (std::size_t at = code.find('('); at != std::string::npos; at = code.find('(', at + 1)) {
        const std::string name = wordBefore(code, at);
        if (names.contains(name)) {
            const std::size_t end = closeOf(code, at);
            calls.push_back({name, lineAt(code, at), code.substr(at + 1, end - at - 1) + ' ', end});
        }
    }
    return calls;
}

/// The lines that hold a check, each as often as it holds one. A declaration is none, nor is a call
/// that hands a place on.
std::vector<std::size_t> checkLinesIn(const std::string& code, const std::set<std::string>& names) {
    std::vector<std::size_t> lines;
    for (const Call& call : callsIn(code, names)) {
        if (!hasWord(call.arguments, "CheckPlace") && !hasWord(call.arguments, "place") &&
            !hasWord(call.arguments, "argumentPlace")) {
            lines.push_back(call.line);
        }
    }
    return lines;
}

/// The functions that use the place of their caller for more than one check.
std::vector<std::string> functionsWithSharedPlaces(const std::string& code,
                                                   const std::set<std::string>& names) {
    std::vector<std::string> found;
    for (const Call& call : callsIn(code, names)) {
        const std::size_t body = code.find_first_of("{;:", call.end);
        if (!hasWord(call.arguments, "CheckPlace") || body == std::string::npos ||
            code[body] != '{') {
            continue;
        }
        std::string rest = code.substr(body, closeOf(code, body) - body);
        std::size_t uses = 0;
        for (const Call& inner : callsIn(rest, names)) {
            uses += hasWord(inner.arguments, "place") ? 1U : 0U;
        }
        if (uses > 1) {
            found.push_back(call.name);
        }
    }
    return found;
}

std::vector<std::size_t> sharedLines(std::vector<std::size_t> lines) {
    std::vector<std::size_t> shared;
    std::sort(lines.begin(), lines.end());
    for (std::size_t i = 1; i < lines.size(); ++i) {
        if (lines[i] == lines[i - 1]) {
            shared.push_back(lines[i]);
        }
    }
    return shared;
}

const std::map<std::string, std::string>& sources() {
    static const std::map<std::string, std::string> read = [] {
        std::map<std::string, std::string> sources;
        const auto add = [&sources](const fs::path& path) {
            std::stringstream text;
            text << std::ifstream(path).rdbuf();
            sources.emplace(fs::relative(path, SOURCE_ROOT), codeOf(text.str()));
        };
        const fs::path root(SOURCE_ROOT);
        add(root / "platform/FailedCheck.h");
        for (const char* const room : {"common", "KSTLib", "kstd"}) {
            for (const auto& entry : fs::recursive_directory_iterator(root / room)) {
                if (entry.path().extension() == ".cpp" || entry.path().extension() == ".h") {
                    add(entry.path());
                }
            }
        }
        return sources;
    }();
    return read;
}

std::set<std::string> checks() {
    std::set<std::string> names;
    for (const auto& [path, code] : sources()) {
        names.merge(checksDeclaredIn(code));
    }
    return names;
}

TEST(CheckPlacesTest, NoTwoChecksOfASourceShareALine) {
    const std::set<std::string> names = checks();
    std::size_t count = 0;
    for (const auto& [path, code] : sources()) {
        const std::vector<std::size_t> lines = checkLinesIn(code, names);
        count += lines.size();
        EXPECT_EQ(sharedLines(lines), std::vector<std::size_t>{}) << path;
    }
    EXPECT_GT(count, 200U);
}

TEST(CheckPlacesTest, NoFunctionLendsItsCallersPlaceToSeveralChecks) {
    const std::set<std::string> names = checks();
    for (const auto& [path, code] : sources()) {
        EXPECT_EQ(functionsWithSharedPlaces(code, names), std::vector<std::string>{}) << path;
    }
}

TEST(CheckPlacesTest, ChecksAreFound) {
    const std::set<std::string> names = checks();
    for (const char* const name : {"fail", "failCall", "failForRoom", "stop", "Argument"}) {
        EXPECT_TRUE(names.contains(name)) << name;
    }
}

TEST(CheckPlacesTest, WhatSharesALineIsFound) {
    const std::set<std::string> names = {"fail", "Argument", "twice"};
    const auto shared = [&names](const char* text) {
        return sharedLines(checkLinesIn(codeOf(text), names));
    };
    const std::vector<std::size_t> none;
    EXPECT_EQ(shared("fail(a);\nfail(b);"), none);
    EXPECT_EQ(shared("\nfail(a); fail(b);"), std::vector<std::size_t>{2});
    EXPECT_EQ(shared("x({Argument(a, \"(\"), Argument(b)});"), std::vector<std::size_t>{1});
    EXPECT_EQ(shared("fail(a); // fail(b)\nfail(a); /* fail(\n) */ fail(b, \"fail()\");"), none);
    EXPECT_EQ(shared("fail(a); failed(b); fail(c, place);"), none);
    EXPECT_EQ(functionsWithSharedPlaces("int twice(int a, CheckPlace place = CheckPlace::here()) {"
                                        "fail(a, place); return fail(a, place); }",
                                        names),
              std::vector<std::string>{"twice"});
}

} // namespace
