// Which room may include which.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

/// The library's public headers: a room of their own in the folder of the library.
constexpr const char* kPublicHeaders = "KSTLib's public headers";

/// Rooms by their folder; a folder inside a room may be one of its own.
const std::vector<std::string> kRooms = {"platform/shared",
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
                                         "kstd-https",
                                         "kstd-notify",
                                         "kstctl",
                                         "tools",
                                         "bench",
                                         "fuzz"};

const std::map<std::string, std::set<std::string>> kMayInclude = {
    {kPublicHeaders, {}},
    {"base", {}},
    {"wire", {kPublicHeaders, "base"}},
    {"platform", {"base"}},
    {"platform/shared", {"platform", "base"}},
    {"platform/https", {"platform", "platform/shared", "base"}},
    {"platform/linux", {"platform", "platform/shared", "wire", "base"}},
    {"platform/fake", {"platform", "platform/shared", "base"}},
    {"common", {kPublicHeaders, "platform", "base"}},
    {"KSTLib", {kPublicHeaders, "common", "platform", "base"}},
    {"kstd/Analytics/SQLite", {"kstd", "common", "platform", "base"}},
    {"kstd/Analytics", {"kstd/Analytics/SQLite", "kstd", "common", "platform", "base"}},
    {"kstd/DeviceRestrictedMode",
     {kPublicHeaders, "kstd/Analytics", "kstd", "KSTLib", "common", "platform", "wire", "base"}},
    {"kstd",
     {kPublicHeaders, "kstd/Analytics", "kstd/DeviceRestrictedMode", "KSTLib", "common", "platform",
      "wire", "base"}},
    {"keystrand", {kPublicHeaders, "common", "wire", "base"}},
    {"keystrand-sim", {"keystrand", kPublicHeaders, "common", "wire", "base"}},
    {"kstd-https", {"platform/https", "platform/shared", "platform", "wire", "base"}},
    {"kstd-notify", {"platform", "platform/linux", "platform/shared", "wire", "base"}},
    {"kstctl",
     {kPublicHeaders, "kstd/Analytics", "kstd/Analytics/SQLite", "kstd/DeviceRestrictedMode",
      "keystrand", "keystrand-sim", "common", "platform", "platform/linux", "platform/shared",
      "wire", "base"}},
    {"tools",
     {kPublicHeaders, "kstd/Analytics", "kstd", "KSTLib", "common", "platform", "platform/linux",
      "keystrand-sim", "wire", "base"}},
    {"bench",
     {kPublicHeaders, "kstd/Analytics", "kstd/Analytics/SQLite", "kstd/DeviceRestrictedMode",
      "kstd", "KSTLib", "common", "platform", "platform/linux", "wire", "base"}},
    {"fuzz", {kPublicHeaders, "KSTLib", "common", "platform", "platform/shared", "wire", "base"}},
};

/// What a single file may include beyond its room.
const std::map<std::string, std::set<std::string>> kMayIncludeToo = {
    {"kstd/main.cpp", {"platform/linux"}},
    {"KSTLib/shared/DefaultPlatform.cpp", {"platform/linux"}},
    {"kstctl/status/LastUpload.cpp", {"kstd"}},
};

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
    const auto extra = kMayIncludeToo.find(include.file);
    return from == to || kMayInclude.at(from).contains(to) ||
           (extra != kMayIncludeToo.end() && extra->second.contains(to));
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
    EXPECT_FALSE(isAllowed({"common/LibCall.cpp", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"KSTLib/KSTLib.h", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"KSTLib/KSTLib.h", "common/Allocation.h"}));
    EXPECT_TRUE(isAllowed({"common/LibCall.cpp", "KSTLib/Status.h"}));
    EXPECT_FALSE(isAllowed({"kstd/Analytics/Upload.cpp", "KSTLib/Channel.h"}));
    EXPECT_FALSE(isAllowed({"kstd/Analytics/SQLite/Opening.cpp", "kstd/Analytics/Analytics.h"}));
    EXPECT_FALSE(isAllowed({"fuzz/fuzz_json.cpp", "platform/linux/Paths.h"}));
    EXPECT_FALSE(isAllowed({"kstd/main.cpp", "platform/https/LinuxHTTPSessions.h"}));
    EXPECT_FALSE(isAllowed({"platform/linux/LinuxHost.cpp", "platform/https/TrustCheck.h"}));
    EXPECT_FALSE(isAllowed({"kstd-https/main.cpp", "platform/linux/Paths.h"}));
    EXPECT_TRUE(isAllowed({"kstd/main.cpp", "platform/linux/LinuxHost.h"}));
}

} // namespace
