#include "platform/linux/alarms/AlarmStore.h"

#include "platform/fake/FakeSystemLog.h"
#include "tests/support/TemporaryDirectory.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <limits>
#include <sys/stat.h>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::Pair;
using testing::UnorderedElementsAre;

constexpr std::int64_t kLatest = std::numeric_limits<std::int64_t>::max();

class AlarmStoreTest : public testing::Test {
  protected:
    [[nodiscard]] std::string fileOf(const std::string& event) const {
        return path + "/stream/" + event;
    }

    [[nodiscard]] std::string contents(const std::string& event) const {
        std::ifstream file(fileOf(event), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }

    void put(const std::string& event, const std::string& text) const {
        std::filesystem::create_directories(path + "/stream");
        std::ofstream(fileOf(event), std::ios::binary) << text;
    }

    support::TemporaryDirectory directory;
    std::string path = directory.file("var/lib/alarms");
    FakeSystemLog log;
    std::string longest = std::string(200, 'n');
    AlarmStore store{path, {"a", "b", "c", longest, longest + "n", "x/y"}, log};
};

TEST_F(AlarmStoreTest, NothingIsRegisteredAtFirst) {
    EXPECT_THAT(store.load("stream"), ElementsAre());
    EXPECT_THAT(log.texts(), ElementsAre());
}

TEST_F(AlarmStoreTest, RegistrationsAreReadBackByStream) {
    EXPECT_TRUE(store.save("stream", "a", {1700000000000000000}));
    EXPECT_TRUE(store.save("stream", "b", {1}));
    EXPECT_TRUE(store.save("other", "a", {2}));
    EXPECT_THAT(store.load("stream"),
                UnorderedElementsAre(Pair("a", Date{1700000000000000000}), Pair("b", Date{1})));
    EXPECT_THAT(store.load("other"), ElementsAre(Pair("a", Date{2})));
    EXPECT_THAT(log.texts(), ElementsAre());
}

TEST_F(AlarmStoreTest, FileHoldsTwentyDigitsAndANewlineForItsOwnerAlone) {
    EXPECT_TRUE(store.save("stream", "a", {1700000000000000000}));
    EXPECT_EQ(contents("a"), "01700000000000000000\n");
    struct stat status {};
    ASSERT_EQ(::stat(fileOf("a").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(AlarmStoreTest, EndsOfTheRangeAreKept) {
    EXPECT_TRUE(store.save("stream", "a", {0}));
    EXPECT_TRUE(store.save("stream", "b", {kLatest}));
    EXPECT_TRUE(store.save("stream", "c", {std::numeric_limits<std::int64_t>::min()}));
    EXPECT_THAT(
        store.load("stream"),
        UnorderedElementsAre(Pair("a", Date{0}), Pair("b", Date{kLatest}), Pair("c", Date{0})));
}

TEST_F(AlarmStoreTest, LaterRegistrationReplacesTheEarlier) {
    EXPECT_TRUE(store.save("stream", "a", {kLatest}));
    EXPECT_TRUE(store.save("stream", "a", {5}));
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{5})));
}

TEST_F(AlarmStoreTest, ClearedRegistrationIsNotReadBackAndMayBeMadeAnew) {
    EXPECT_TRUE(store.save("stream", "a", {5}));
    store.clear("stream", "a");
    EXPECT_EQ(contents("a"), "none                \n");
    EXPECT_THAT(store.load("stream"), ElementsAre());
    EXPECT_TRUE(store.save("stream", "a", {6}));
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{6})));
}

TEST_F(AlarmStoreTest, DateThatThisStorePutThereIsNotWrittenAgain) {
    EXPECT_TRUE(store.save("stream", "a", {5}));
    put("a", "changed behind its back");
    EXPECT_TRUE(store.save("stream", "a", {5}));
    EXPECT_EQ(contents("a"), "changed behind its back");
    EXPECT_TRUE(store.save("stream", "a", {6}));
    EXPECT_EQ(contents("a"), "00000000000000000006\n");
}

TEST_F(AlarmStoreTest, DateThatWasOnlyReadIsWrittenAndSynced) {
    put("a", "00000000000000000005\n");
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{5})));
    put("a", "changed behind its back");
    EXPECT_TRUE(store.save("stream", "a", {5}));
    EXPECT_EQ(contents("a"), "00000000000000000005\n");
}

TEST_F(AlarmStoreTest, CancelledAlarmIsNotCancelledAgain) {
    EXPECT_TRUE(store.save("stream", "a", {5}));
    store.clear("stream", "a");
    put("a", "changed behind its back");
    store.clear("stream", "a");
    EXPECT_EQ(contents("a"), "changed behind its back");
}

TEST_F(AlarmStoreTest, ClearingWhatIsNotThereIsSilent) {
    store.clear("stream", "a");
    EXPECT_THAT(log.texts(), ElementsAre());
    EXPECT_FALSE(std::filesystem::exists(path));
}

class BrokenFileTest : public AlarmStoreTest, public testing::WithParamInterface<std::string> {};

TEST_P(BrokenFileTest, StandsForAnAlarmThatIsDue) {
    put("a", GetParam());
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{0})));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: unreadable alarm, taken as due: " +
                                         fileOf("a") + "."));
}

INSTANTIATE_TEST_SUITE_P(Contents, BrokenFileTest,
                         testing::Values("", "0170000000000000000\n", "01700000000000000000",
                                         "017000000000000000000\n", "0170000000000000000x\n",
                                         "99999999999999999999\n", "-1700000000000000000\n",
                                         "none\n", std::string(21, '\0')));

TEST_F(AlarmStoreTest, FileThatCannotBeReadStandsForAnAlarmThatIsDueAndTheLineSaysWhy) {
    std::filesystem::create_directories(fileOf("a"));
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{0})));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: unreadable alarm, taken as due: " +
                                         fileOf("a") + ": Is a directory."));
}

TEST_F(AlarmStoreTest, BrokenFileIsWholeAgainAfterTheNextRegistration) {
    put("a", std::string(100, 'x'));
    EXPECT_TRUE(store.save("stream", "a", {7}));
    EXPECT_EQ(contents("a"), "00000000000000000007\n");
}

TEST_F(AlarmStoreTest, NamesThatCannotBeFilesAreNotKeptAndSaidSo) {
    for (const std::string name : {"", ".", "..", "x/y", "unknown", "../../escape"}) {
        log.clear();
        EXPECT_FALSE(store.save("stream", name, {1}));
        EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: cannot keep the alarm on disk: " +
                                             fileOf(name) + ": no alarm has such a name."));
    }
    for (const std::string stream : {"", ".", "..", "x/y"}) {
        EXPECT_FALSE(store.save(stream, "a", {1}));
    }
    EXPECT_FALSE(std::filesystem::exists(path));
    EXPECT_THAT(store.load("stream"), ElementsAre());
}

TEST_F(AlarmStoreTest, LongestNameIsKept) {
    EXPECT_TRUE(store.save("stream", longest, {1}));
    EXPECT_FALSE(store.save("stream", longest + "n", {1}));
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair(longest, Date{1})));
}

TEST_F(AlarmStoreTest, DirectoryThatCannotBeMadeIsSaid) {
    std::ofstream(directory.file("var")) << "a file";
    EXPECT_FALSE(store.save("stream", "a", {1}));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: cannot keep the alarm on disk: " +
                                         fileOf("a") + ": Not a directory."));
}

TEST_F(AlarmStoreTest, FailureIsSaidOnceUntilItWentWell) {
    const std::string line =
        "kstd: AlarmStore: cannot keep the alarm on disk: " + fileOf("a") + ": Not a directory.";
    std::ofstream(directory.file("var")) << "a file";
    EXPECT_FALSE(store.save("stream", "a", {1}));
    EXPECT_FALSE(store.save("stream", "a", {1}));
    EXPECT_FALSE(store.save("stream", "a", {2}));
    EXPECT_THAT(log.texts(), ElementsAre(line));
    std::filesystem::remove(directory.file("var"));
    EXPECT_TRUE(store.save("stream", "a", {2}));
    std::filesystem::remove_all(directory.file("var"));
    std::ofstream(directory.file("var")) << "a file";
    EXPECT_FALSE(store.save("stream", "a", {3}));
    EXPECT_THAT(log.texts(), ElementsAre(line, line));
}

TEST_F(AlarmStoreTest, LostAlarmIsSaidWithTheReason) {
    std::ofstream(directory.file("var")) << "a file";
    EXPECT_FALSE(store.save("stream", "a", {1}));
    log.clear();
    store.reportLost("stream", "a");
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: the alarm is lost until the kernel "
                                         "side sends it again: " +
                                         fileOf("a") + ": Not a directory."));
}

TEST_F(AlarmStoreTest, DirectoryThatCannotBeReadStandsForAlarmsThatAreDue) {
    std::filesystem::create_directories(path);
    std::ofstream(path + "/stream") << "a file";
    AlarmStore two(path, {"a", "b"}, log);
    EXPECT_THAT(two.load("stream"), ElementsAre(Pair("a", Date{0}), Pair("b", Date{0})));
    EXPECT_THAT(log.texts(), ElementsAre("kstd: AlarmStore: unreadable directory, every alarm "
                                         "taken as due: " +
                                         path + "/stream: Not a directory."));
}

TEST_F(AlarmStoreTest, NothingIsClearedInAStreamThatIsNone) {
    std::filesystem::create_directories(path);
    std::ofstream(path + "/a") << "00000000000000000001\n";
    for (const std::string stream : {"", ".", "..", "stream/..", "/"}) {
        store.clear(stream, "a");
    }
    std::ifstream file(path + "/a");
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "00000000000000000001\n");
    EXPECT_THAT(log.texts(), ElementsAre());
}

TEST_F(AlarmStoreTest, FilesThatAreNoAlarmsAreLeftAloneAndNamed) {
    EXPECT_TRUE(store.save("stream", "a", {5}));
    const std::string foreign[] = {"a.bak", ".a.swp", "A", "x"};
    for (const std::string& name : foreign) {
        put(name, "00000000000000000001\n");
    }
    std::filesystem::create_directory(path + "/stream/directory");
    EXPECT_THAT(store.load("stream"), ElementsAre(Pair("a", Date{5})));
    EXPECT_EQ(log.texts().size(), 5U);
    for (const std::string& name : foreign) {
        EXPECT_THAT(log.texts(), testing::Contains("kstd: AlarmStore: no alarm of the daemon, left "
                                                   "alone: " +
                                                   fileOf(name) + "."));
        store.clear("stream", name);
        EXPECT_EQ(contents(name), "00000000000000000001\n");
    }
}

} // namespace
} // namespace platform
