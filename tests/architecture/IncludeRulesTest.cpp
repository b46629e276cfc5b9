// Which room may include which.

#include <gtest/gtest.h>

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

/// The library's public headers: a room of their own in the folder of the library.
constexpr const char* kPublicHeaders = "public headers";

/// Rooms by their folder; a folder inside a room may be one of its own.
const std::vector<std::string> kRooms = {"platform/formats",
                                         "platform/host",
                                         "platform/https",
                                         "platform/linux",
                                         "platform/fake",
                                         "platform",
                                         "base",
                                         "wire",
                                         "common",
                                         "KSTLib",
                                         "kstd/Analytics/SQLite",
                                         "kstd/Analytics",
                                         "kstd/DeviceRestrictedMode",
                                         "kstd",
                                         "keystrand",
                                         "keystrand-sim",
                                         "keystrand-linux",
                                         "keystrand-sessions",
                                         "kstd-https",
                                         "kstd-notify",
                                         "kstctl",
                                         "tools",
                                         "bench",
                                         "fuzz",
                                         "tests/support"};

/// Who may include whom: rooms, and files that may more than their room.
struct Rules {
    std::map<std::string, std::set<std::string>> rooms;
    std::map<std::string, std::set<std::string>> files;
};

std::string trimmed(const std::string& text) {
    const std::size_t start = text.find_first_not_of(' ');
    return start == std::string::npos ? std::string()
                                      : text.substr(start, text.find_last_not_of(' ') + 1 - start);
}

void addNames(std::set<std::string>& names, const std::string& list) {
    std::istringstream stream(list);
    for (std::string name; std::getline(stream, name, ',');) {
        if (name = trimmed(name); !name.empty() && name != "nothing") {
            names.insert(name);
        }
    }
}

/// The lines of the table in the document on the architecture.
std::vector<std::string> linesOfTable() {
    std::ifstream document(fs::path(SOURCE_ROOT) / "docs/architecture.md");
    std::string line;
    while (std::getline(document, line) && line.rfind("Who may include whom", 0) != 0) {
    }
    while (std::getline(document, line) && line != "```") {
    }
    std::vector<std::string> lines;
    while (std::getline(document, line) && line != "```") {
        lines.push_back(line);
    }
    return lines;
}

/// A name, two blanks or more, and a list, which may go on in the next line.
Rules readRules() {
    const std::string also = "also ";
    Rules rules;
    std::set<std::string>* names = nullptr;
    for (const std::string& line : linesOfTable()) {
        const std::size_t gap = line.find("  ");
        if (gap == std::string::npos || (gap == 0 && names == nullptr)) {
            ADD_FAILURE() << "not a line of the table: " << line;
            continue;
        }
        std::string list = trimmed(line.substr(gap));
        if (gap > 0) {
            const bool isFile = list.rfind(also, 0) == 0;
            list = isFile ? list.substr(also.size()) : list;
            names = &(isFile ? rules.files : rules.rooms)[line.substr(0, gap)];
        }
        addNames(*names, list);
    }
    return rules;
}

const Rules& rules() {
    static const Rules read = readRules();
    return read;
}

const std::set<std::string>& publicHeaders() {
    static const std::set<std::string> headers = [] {
        std::ifstream list(fs::path(SOURCE_ROOT) / "KSTLib/shared/public-headers");
        return std::set<std::string>{std::istream_iterator<std::string>(list), {}};
    }();
    return headers;
}

std::string roomOf(const std::string& path) {
    if (publicHeaders().contains(path)) {
        return kPublicHeaders;
    }
    for (const std::string& room : kRooms) {
        if (path.rfind(room + "/", 0) == 0) {
            return room;
        }
    }
    return "";
}

struct Include {
    std::string file;
    std::string target;
};

/// Every include of one of our own headers, as it is written.
std::vector<Include> includesOfTree() {
    std::vector<Include> includes;
    for (const std::string& room : kRooms) {
        for (const auto& entry : fs::recursive_directory_iterator(fs::path(SOURCE_ROOT) / room)) {
            const std::string file = fs::relative(entry.path(), SOURCE_ROOT).string();
            if (!entry.is_regular_file() ||
                (roomOf(file) != room && roomOf(file) != kPublicHeaders)) {
                continue;
            }
            std::ifstream stream(entry.path());
            for (std::string line; std::getline(stream, line);) {
                if (line.rfind("#include \"", 0) == 0) {
                    includes.push_back({file, line.substr(10, line.rfind('"') - 10)});
                }
            }
        }
    }
    return includes;
}

bool isAllowed(const Include& include) {
    const std::string from = roomOf(include.file);
    const std::string to = roomOf(include.target);
    const auto room = rules().rooms.find(from);
    const auto extra = rules().files.find(include.file);
    return from == to || (room != rules().rooms.end() && room->second.contains(to)) ||
           (extra != rules().files.end() && extra->second.contains(to));
}

TEST(IncludeRulesTest, TableIsAboutTheRoomsAndTheFilesThatAreThere) {
    std::set<std::string> rooms(kRooms.begin(), kRooms.end());
    rooms.insert(kPublicHeaders);
    std::set<std::string> inTable;
    for (const auto& [room, names] : rules().rooms) {
        inTable.insert(room);
        for (const std::string& name : names) {
            EXPECT_TRUE(rooms.contains(name)) << room << " may include " << name;
        }
    }
    EXPECT_EQ(inTable, rooms);
    for (const auto& [file, names] : rules().files) {
        EXPECT_TRUE(fs::is_regular_file(fs::path(SOURCE_ROOT) / file)) << file;
        for (const std::string& name : names) {
            EXPECT_TRUE(rooms.contains(name)) << file << " may include " << name;
        }
    }
}

TEST(IncludeRulesTest, EveryIncludeIsAllowedByTheHouse) {
    const auto includes = includesOfTree();
    EXPECT_GT(includes.size(), 300U);
    for (const Include& include : includes) {
        EXPECT_TRUE(isAllowed(include)) << include.file << " includes " << include.target;
    }
}

TEST(IncludeRulesTest, EveryIncludeIsWrittenFromTheRootOfTheTree) {
    for (const Include& include : includesOfTree()) {
        EXPECT_TRUE(fs::exists(fs::path(SOURCE_ROOT) / include.target))
            << include.file << " includes " << include.target;
    }
}

TEST(IncludeRulesTest, RulesRefuseWhatTheyShould) {
    EXPECT_FALSE(isAllowed({"kstd/Daemon.cpp", "platform/linux/LinuxHost.h"}));
    EXPECT_FALSE(isAllowed({"kstd/Daemon.cpp", "platform/fake/FakeHost.h"}));
    EXPECT_FALSE(isAllowed({"keystrand-sim/main.cpp", "kstd/Daemon.h"}));
    EXPECT_FALSE(isAllowed({"keystrand/RequestHandler.cpp", "keystrand-sim/FaultScript.h"}));
    EXPECT_FALSE(isAllowed({"keystrand-sessions/SessionsWatch.cpp", "keystrand-linux/UsbBus.h"}));
    EXPECT_FALSE(isAllowed({"common/LibCall.cpp", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"KSTLib/KSTLib.h", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"KSTLib/KSTLib.h", "common/Allocation.h"}));
    EXPECT_TRUE(isAllowed({"common/LibCall.cpp", "KSTLib/Status.h"}));
    for (const char* const outside : {"kstd/KSTService.cpp", "kstctl/Report.cpp", "tools/dev.cpp",
                                      "keystrand/Evaluation.cpp", "keystrand-sim/RequestLog.cpp"}) {
        EXPECT_FALSE(isAllowed({outside, "common/Failure.h"})) << outside;
    }
    EXPECT_FALSE(isAllowed({"kstd/Analytics/KSTDAnalyticsLoggerUpload.cpp", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"kstd/Analytics/SQLite/KSTDSQLite.cpp", "kstd/Analytics/Analytics.h"}));
    EXPECT_FALSE(isAllowed({"fuzz/fuzz_json.cpp", "platform/linux/Paths.h"}));
    EXPECT_FALSE(isAllowed({"kstd/main.cpp", "platform/https/HTTPTransfer.h"}));
    EXPECT_FALSE(isAllowed({"platform/linux/LinuxHost.cpp", "platform/https/TrustCheck.h"}));
    EXPECT_FALSE(isAllowed({"kstd-https/main.cpp", "platform/linux/Paths.h"}));
    EXPECT_TRUE(isAllowed({"kstd/main.cpp", "platform/linux/LinuxHost.h"}));
}

} // namespace
