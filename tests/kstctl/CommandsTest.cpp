// The other commands, beside the real daemon and keystrand-sim.

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "platform/formats/PropertyListCodec.h"
#include "tests/kstctl/KstctlFixture.h"

#include <chrono>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace kstctl {
namespace {

namespace fs = std::filesystem;

using base::concat;
using platform::Null;
using platform::Value;

/// A text with a T for each time in it.
std::string withoutTimes(const std::string& text) {
    return std::regex_replace(text, std::regex(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\dZ|\d{9,13}\.\d+)"),
                              "T");
}

class KstctlCommandsTest : public KstctlFixture {
  protected:
    /// Starts everything and keeps an event of each name.
    void keepTwoEvents() {
        startKernel();
        configure({});
        launch();
        publishEvent();
        publishPolicyEvent();
    }

    void addRow(const platform::ValueMap& event) const {
        const auto data = platform::writeBinaryPropertyList(Value(event)).value();
        EXPECT_EQ(OtherConnection(database())
                      .run("insert into all_events (timestamp, data) values (0, x'" +
                           system_tests::hex(data) + "')"),
                  SQLITE_OK);
    }
};

constexpr char kPolicyAttributes[] =
    "eventPeriodDuration=86400 eventVersion=3 policyDisabledByBootArg=0 "
    "policyDisabledByPasscodeNotSet=0 policyDisabledByQuorvane=0 policyEnabled=1 restrictedMode=1 "
    "restrictedModeDuration=3600 topic=kst";

TEST_F(KstctlCommandsTest, EventsAsTable) {
    keepTwoEvents();
    const std::string heading = "ID  ADDED                 TYPE            ATTRIBUTES\n";
    const std::string first =
        "1   T  timerRestarted  eventVersion=4 topic=kst totalRestrictedModeDurationMin=1\n";
    const std::string second = concat("2   T  policy          ", kPolicyAttributes, "\n");
    EXPECT_EQ(withoutTimes(kstctl({"events", "list"}).out), heading + first + second);
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--limit", "3"}).out),
              heading + first + second);
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--limit", "2"}).out),
              heading + first + second);
    const std::string narrow = "ID  ADDED                 TYPE    ATTRIBUTES\n";
    const std::string alone = concat("2   T  policy  ", kPolicyAttributes, "\n");
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--limit", "1"}).out), narrow + alone);
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--type", "policy"}).out), narrow + alone);
    // Decimal digits, whatever stands before them.
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--limit", "0001"}).out), narrow + alone);
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--limit", "9223372036854775807"}).out),
              heading + first + second);
    EXPECT_EQ(kstctl({"events", "list", "--limit", "0"}).out, "ID  ADDED  TYPE  ATTRIBUTES\n");
    EXPECT_EQ(withoutTimes(kstctl({"events", "show", "1"}).out),
              "id: 1\nadded: T (T)\nevent:\n  eventTime: T\n  eventType: timerRestarted\n"
              "  eventVersion: 4\n  topic: kst\n  totalRestrictedModeDurationMin: 1\n");
    EXPECT_EQ(withoutTimes(kstctl({"events", "export"}).out),
              "id\tadded\teventPeriodDuration\teventTime\teventType\teventVersion\t"
              "policyDisabledByBootArg\tpolicyDisabledByPasscodeNotSet\tpolicyDisabledByQuorvane\t"
              "policyEnabled\trestrictedMode\trestrictedModeDuration\ttopic\t"
              "totalRestrictedModeDurationMin\n"
              "1\tT\t\tT\ttimerRestarted\t4\t\t\t\t\t\t\tkst\t1\n"
              "2\tT\t86400\tT\tpolicy\t3\t0\t0\t0\t1\t1\t3600\tkst\t\n");
}

TEST_F(KstctlCommandsTest, EventsOnTerminals) {
    keepTwoEvents();
    const std::string line = "2   T  policy";
    EXPECT_EQ(withoutTimes(kstctl({"events", "list", "--type", "policy"},
                                  {.onTerminal = true, .columns = 60, .environment = {"TERM=dumb"}})
                               .out),
              concat("ID  ADDED                 TYPE\r\n  ATTRIBUTES\r\n", line, "\r\n",
                     "  eventPeriodDuration=86400 eventVersion=3\r\n"
                     "  policyDisabledByBootArg=0 policyDisabledByPasscodeNotSet=0\r\n"
                     "  policyDisabledByQuorvane=0 policyEnabled=1\r\n"
                     "  restrictedMode=1 restrictedModeDuration=3600 topic=kst\r\n"));
    const std::string wide = concat("ID  ADDED                 TYPE    ATTRIBUTES\r\n", line, "  ",
                                    kPolicyAttributes, "\r\n");
    // The room of one that does not say has no end.
    for (const auto columns : {static_cast<unsigned short>(0), static_cast<unsigned short>(300)}) {
        EXPECT_EQ(withoutTimes(
                      kstctl({"events", "list", "--type", "policy"},
                             {.onTerminal = true, .columns = columns, .environment = {"TERM=dumb"}})
                          .out),
                  wide);
    }
}

TEST_F(KstctlCommandsTest, EventsAsJSON) {
    keepTwoEvents();
    const Value all = json({"events", "list"});
    EXPECT_EQ(at(all, "stored"), Value(std::int64_t{2}));
    EXPECT_EQ(at(all, "uploadDate"), Value(OtherConnection(database()).property("upload_date")));
    EXPECT_EQ(at(all, "events.0.id"), Value(std::int64_t{1}));
    EXPECT_EQ(at(all, "events.0.event.eventType"), Value("timerRestarted"));
    EXPECT_EQ(at(all, "events.1.event.restrictedModeDuration"), Value(std::int64_t{3600}));
    EXPECT_EQ(pathsIn(at(all, "events.0")),
              (std::vector<std::string>{"added", "addedText", "event", "event.eventTime",
                                        "event.eventType", "event.eventVersion", "event.topic",
                                        "event.totalRestrictedModeDurationMin", "id"}));
    EXPECT_EQ(json({"events", "export"}), all);
    EXPECT_EQ(json({"events", "show", "2"}), at(all, "events.1"));
    const Value last = json({"events", "list", "--limit", "1"});
    EXPECT_EQ(at(last, "stored"), Value(std::int64_t{2}));
    EXPECT_EQ(at(last, "events.0"), at(all, "events.1"));
}

TEST_F(KstctlCommandsTest, EventsOfHostileContent) {
    keepTwoEvents();
    addRow({{"eventType", "a\x1b[2Jb\n"},
            {"k\x1b=", "\xc2\x9b 1"},
            {"\tlist", platform::ValueList{"\r"}}});
    EXPECT_EQ(OtherConnection(database()).run("insert into all_events (data) values (x'00')"),
              SQLITE_OK);
    const std::string table = kstctl({"events", "list", "--limit", "2"}).out;
    EXPECT_EQ(table,
              "ID  ADDED                 TYPE         ATTRIBUTES\n"
              "3   2001-01-01T00:00:00Z  a\\x1b[2Jb\\n  \\tlist=[\"\\\\r\"] k\\x1b==\\u{9b} 1\n"
              "4                                      (no event in this row)\n");
    EXPECT_EQ(kstctl({"events", "show", "3"}).out,
              "id: 3\nadded: 0 (2001-01-01T00:00:00Z)\nevent:\n  \\tlist:\n    - \\r\n"
              "  eventType: a\\x1b[2Jb\\n\n  k\\x1b=: \\u{9b} 1\n");
    EXPECT_EQ(kstctl({"events", "show", "4"}).out,
              "id: 4\nadded: none\nevent: unknown: no event in this row\n");
    EXPECT_EQ(at(json({"events", "show", "3"}), "event.eventType"), Value("a\x1b[2Jb\n"));
    const Value broken = json({"events", "show", "4"});
    EXPECT_EQ(at(broken, "event"), Value(Null()));
    EXPECT_EQ(at(broken, "eventUnknown"), Value("no event in this row"));
}

TEST_F(KstctlCommandsTest, ExportIntoAFile) {
    keepTwoEvents();
    const std::string file = root.path() / "export.tsv";
    EXPECT_EQ(kstctl({"events", "export", "--output", file}).out, "");
    std::ifstream stream(file);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(stream), {}),
              kstctl({"events", "export"}).out);
    struct stat status {};
    ASSERT_EQ(::stat(file.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600U);
    expectFailure({"events", "export", "--output", file}, 1, file + ": File exists");
    const std::string nowhere = root.path() / "nowhere" / "x";
    expectFailure({"events", "export", "--output", nowhere}, 1,
                  nowhere + ": No such file or directory");
    expectFailure({"events", "export", "--output", "/dev/full"}, 1, "/dev/full: File exists");
}

TEST_F(KstctlCommandsTest, WhatIsMissing) {
    const std::string missing = database() + ": No such file or directory";
    for (const Arguments& arguments :
         {Arguments{"events", "list"}, Arguments{"events", "show", "1"},
          Arguments{"events", "export"}, Arguments{"upload", "--dry-run"}}) {
        expectFailure(arguments, 3, missing);
    }
    const std::string socket = real("/run/kstd/events.sock");
    expectFailure({"send", "settings"}, 3,
                  concat("there is no event socket at ", socket,
                         "; the daemon is not installed, or its socket was not started"));
    expectFailure({"sim", "status"}, 3,
                  "no keystrand-sim listens at " + real("/run/keystrand/control.sock"));
    expectFailure({"decode", "--file", real("/nothing")}, 3,
                  real("/nothing") + ": No such file or directory");
    const Ran ran = runKstctl({"--root", real("/nowhere"), "status"});
    EXPECT_EQ(ran.status, 3);
    EXPECT_EQ(ran.err, concat("kstctl: there is no directory ", real("/nowhere"), "\n"));
    keepTwoEvents();
    expectFailure({"events", "show", "3"}, 3, "there is no event 3");
    daemon->signal(SIGKILL);
    daemon->awaitEnd();
    expectFailure({"send", "settings"}, 3,
                  concat("nobody keeps the event socket ", socket, " open"));
}

TEST_F(KstctlCommandsTest, WrongCommandLines) {
    const std::pair<Arguments, std::string> kWrong[] = {
        {{}, "A subcommand is required"},
        {{"status", "mo\x1bre"}, "The following argument was not expected: mo\\x1bre"},
        {{"bogus"}, "there is no command bogus"},
        {{"--json", "bog\x1bus", "more"}, "there is no command bog\\x1bus"},
        {{"bogus", "status"}, "The following argument was not expected: bogus"},
        {{"--bogus"}, "A subcommand is required"},
        {{"--bogus", "status"}, "The following argument was not expected: --bogus"},
        {{"events"}, "A subcommand is required"},
        {{"events", "bogus"}, "there is no command bogus"},
        {{"events", "show"}, "id is required"},
        {{"events", "show", "x"},
         "id: Value x not in range -9223372036854775808 to 9223372036854775807"},
        {{"events", "show", "9223372036854775808"},
         "id: Value 9223372036854775808 not in range -9223372036854775808 to 9223372036854775807"},
        {{"events", "list", "--limit", "-1"},
         "--limit: Value -1 not in range 0 to 9223372036854775807"},
        {{"events", "list", "--limit", "9223372036854775808"},
         "--limit: Value 9223372036854775808 not in range 0 to 9223372036854775807"},
        {{"events", "list", "--limit", "99999999999999999999999"},
         "--limit: Value 99999999999999999999999 not in range 0 to 9223372036854775807"},
        {{"events", "list", "--limit", "0x10"},
         "--limit: Value 0x10 not in range 0 to 9223372036854775807"},
        {{"events", "list", "--limit", "5 "},
         "--limit: Value 5  not in range 0 to 9223372036854775807"},
        {{"events", "list", "--limit", ""},
         "--limit: Value  not in range 0 to 9223372036854775807"},
        {{"upload"}, "--dry-run or --now is required"},
        {{"upload", "--post-time", "1"}, "--dry-run or --now is required"},
        {{"upload", "--now", "--dry-run"}, "--dry-run excludes --now"},
        {{"upload", "--now", "--post-time", "1"}, "--post-time excludes --now"},
        {{"upload", "--dry-run", "--post-time", "nan"},
         "--post-time: Value nan not in range 0.000000 to 253402300800000.000000"},
        {{"upload", "--dry-run", "--post-time", "yesterday"},
         "--post-time: Value yesterday not in range 0.000000 to 253402300800000.000000"},
        {{"upload", "--dry-run", "--post-time", "-1"},
         "--post-time: Value -1 not in range 0.000000 to 253402300800000.000000"},
        {{"send"}, "name is required"},
        {{"send", "setings"}, "there is no event setings; --exact sends it all the same"},
        {{"send", "alarm", "--date", "yesterday"}, "no date: yesterday"},
        {{"send", "settings", "--payload", "zz"},
         "--payload zz: no hexadecimal digits: another character at character 1"},
        {{"send", "settings", "--payload", "00", "--date", "1"}, "--payload excludes --date"},
        {{"decode", "--kind", "state", "--payload-of", "5", "00"}, "--kind excludes --payload-of"},
        {{"decode", "--file", "x", "00"}, "hex excludes --file"},
        {{"--wait", "3600001", "status"}, "--wait: Value 3600001 not in range 0 to 3600000"},
        {{"--wait", "-1", "status"}, "--wait: Value -1 not in range 0 to 3600000"},
        {{"status", "more"}, "The following argument was not expected: more"},
        {{"sim"}, "words is required"},
    };
    for (const auto& [arguments, line] : kWrong) {
        expectFailure(arguments, 2, line);
    }
    EXPECT_EQ(kstctl({"decode", "--kind", "bogus", "00"}).status, 2);
    EXPECT_EQ(kstctl({"decode", "--payload-of", "7", "00"}).status, 2);
    expectFailure({"decode"}, 2, "give the bytes, or a file with --file", {.onTerminal = true});
}

TEST_F(KstctlCommandsTest, HelpAndVersion) {
    EXPECT_EQ(kstctl({"--version"}).out, "kstctl " KSTD_VERSION "\n");
    for (const Arguments& arguments :
         {Arguments{"--help"}, Arguments{"status", "--help"}, Arguments{"events", "list", "-h"}}) {
        const Ran ran = kstctl(arguments);
        EXPECT_EQ(ran.status, 0);
        EXPECT_NE(ran.out.find("Usage: kstctl"), std::string::npos);
    }
    EXPECT_NE(runKstctl({"--help"}, {.outputFile = "/dev/full"}).status, 0);
}

TEST_F(KstctlCommandsTest, EventsThatTheDaemonHandles) {
    startKernel();
    launch();
    EXPECT_EQ(kstctl({"send", "settings"}).out, "");
    EXPECT_TRUE(
        daemon->awaitLine("Wisp Event: com.zerva.quorvane.effectivesettingschanged (notifyd)."));
    kernel("wait control=5 count=1");
    kernel("property set KSTRMTimerRestarted 0400000078000000" + std::string(56, '0'));
    EXPECT_EQ(kstctl({"send", "timer-restarted", "--stream", "corvid"}).status, 0);
    EXPECT_TRUE(daemon->awaitLine("Wisp Event: com.zerva.Keystrand.KSTRMTimerRestarted (corvid)."));
    kernel("wait acks=1");
    EXPECT_EQ(kstctl({"send", "--exact", "nonsense"}).status, 0);
    EXPECT_TRUE(daemon->awaitLine("Wisp Event: nonsense (notifyd)."));
    const Value sent = json({"send", "a.b", "--payload", "c0 DE"});
    EXPECT_EQ(at(sent, "stream"), Value("com.zerva.notifyd.matching"));
    EXPECT_EQ(at(sent, "name"), Value("a.b"));
    EXPECT_EQ(at(sent, "payload"), Value("c0de"));
    EXPECT_EQ(at(sent, "size"), Value(std::int64_t{12 + 26 + 3 + 2}));
    EXPECT_TRUE(daemon->awaitLine("Wisp Event: a.b (notifyd)."));
}

TEST_F(KstctlCommandsTest, AlarmIsSentForItsRegisteredDate) {
    startKernel();
    launch();
    expectFailure({"send", "alarm"}, 1,
                  "no alarm com.zerva.kstd.alarm is registered; give its --date");
    kernel("publish timer-restarted alarm=9000000000");
    kernel("wait acks=1");
    // Another date is dropped by the daemon.
    EXPECT_EQ(kstctl({"send", "alarm", "--date", "9000000001"}).status, 0);
    EXPECT_EQ(kstctl({"send", "alarm"}).status, 0);
    EXPECT_TRUE(daemon->awaitLine("init]_block_invoke: alarm."));
    EXPECT_EQ(daemon->count("init]_block_invoke: alarm."), 1U);
    EXPECT_EQ(at(json({"status"}), "alarms.registered"), Value(platform::ValueList()));
}

TEST_F(KstctlCommandsTest, EventsThatCannotBeSent) {
    expectFailure({"send", "settings", "--payload", "0"}, 2,
                  "--payload 0: no hexadecimal digits: half a byte at character 2");
    const std::string unfit = "an event of these names and this payload cannot be expressed";
    expectFailure({"send", std::string(1025, '.')}, 5, unfit);
    expectFailure({"send", "a.b", "--stream", std::string(256, '.')}, 5, unfit);
    expectFailure({"send", "a.b", "--payload", std::string(2 * 4096, '0')}, 5, unfit);
    expectFailure({"send", "", "--exact"}, 5, unfit);
}

TEST_F(KstctlCommandsTest, FullSocketIsNotWaitedForForEver) {
    const std::string path = real("/run/kstd/events.sock");
    const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(path).value();
    ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    const base::FileDescriptor sender(
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    ASSERT_EQ(::connect(sender.get(), address.get(), address.size()), 0);
    while (::send(sender.get(), "x", 1, 0) == 1) {
    }
    expectFailure({"send", "settings", "--wait", "20"}, 1,
                  concat("the event socket ", path, " is full and nobody empties it"));
}

TEST_F(KstctlCommandsTest, UploadIsMadeDue) {
    expectFailure({"upload", "--now"}, 3, database() + ": No such file or directory");
    EXPECT_FALSE(fs::exists(database()));
    keepTwoEvents();
    EXPECT_EQ(at(json({"status"}), "database.isUploadDue"), Value(false));
    const auto dump = [this] {
        return OtherConnection(database())
            .one("select group_concat(key || value) from Properties "
                 "where key <> 'upload_date'");
    };
    const std::string others = dump();
    const auto now = [] {
        return static_cast<double>(std::chrono::system_clock::now().time_since_epoch().count()) /
               1e9;
    };
    const double before = now();
    const Value due = json({"upload", "--now"});
    const std::string stored = OtherConnection(database()).property("upload_date");
    EXPECT_EQ(at(due, "uploadDate"), Value(stored));
    EXPECT_EQ(at(due, "isConfigured"), Value(false));
    EXPECT_GE(static_cast<double>(uploadDate()), std::floor(before - 1));
    EXPECT_LE(static_cast<double>(uploadDate()), now() - 1);
    EXPECT_EQ(at(json({"status"}), "database.isUploadDue"), Value(true));
    EXPECT_EQ(storedEvents(), 2);
    EXPECT_EQ(dump(), others);
    OtherConnection(database()).run("delete from Properties where key = 'upload_date'");
    EXPECT_EQ(kstctl({"upload", "--now"}).out.rfind("uploadDate: 2", 0), 0U);
    EXPECT_EQ(at(json({"status"}), "database.isUploadDue"), Value(true));
    // The daemon, which has the database open, tries at the next event.
    const system_tests::Lines lines = publishEvent();
    ASSERT_FALSE(lines.empty());
    EXPECT_EQ(lines.back(), "failed to get a splunk upload endpoint - not uploading");

    OtherConnection writer(database());
    writer.run("begin exclusive");
    expectFailure({"upload", "--now", "--wait", "1"}, 1, database() + ": database is locked (5)");
    writer.run("rollback");
}

TEST_F(KstctlCommandsTest, OnlyADatabaseOfEventsIsWritten) {
    fs::create_directories(fs::path(database()).parent_path());
    std::ofstream(database()) << "something else, and quite long. something else, and quite long.";
    auto before = files();
    expectFailure({"upload", "--now"}, 5, database() + ": file is not a database (26)");
    EXPECT_EQ(files(), before);
    fs::remove(database());
    OtherConnection(database()).run("pragma journal_mode = WAL");
    before = files();
    expectFailure({"upload", "--now"}, 3, database() + ": nothing is stored in it yet");
    EXPECT_EQ(files(), before);
    OtherConnection(database()).run("create table other (id)");
    before = files();
    expectFailure({"upload", "--now"}, 5, database() + ": not a database of kstd's events");
    EXPECT_EQ(files(), before);
}

TEST_F(KstctlCommandsTest, SimulatorIsDriven) {
    startKernel({"--quiet", "--clock", "1700000000"});
    EXPECT_EQ(kstctl({"sim", "lock"}).out, "");
    EXPECT_EQ(kstctl({"sim", "clock", "advance", "60"}).status, 0);
    const std::string status = kstctl({"sim", "status"}).out;
    EXPECT_EQ(status.rfind("clock manual\nnow 1700000060\nlocked on\n", 0), 0U) << status;
    const Value answer = json({"sim", "env", "get", "7"});
    EXPECT_EQ(at(answer, "isOK"), Value(true));
    EXPECT_EQ(at(answer, "error"), Value(Null()));
    EXPECT_EQ(at(answer, "lines.0"), Value("value empty"));
    expectFailure({"sim", "property", "get", "nothing"}, 1, "keystrand-sim: absent");
    const Value refused = json({"sim", "property", "get", "nothing"}, 1);
    EXPECT_EQ(at(refused, "isOK"), Value(false));
    EXPECT_EQ(at(refused, "error"), Value("absent"));
    EXPECT_EQ(at(refused, "lines"), Value(platform::ValueList()));
    expectFailure({"sim", "two\nlines"}, 1, "keystrand-sim: cannot send");
}

TEST_F(KstctlCommandsTest, BytesFromEverywhere) {
    const std::string state = std::string("\1\0\0\0", 4) + std::string(8, '\0') + '\1';
    const std::string text = "kind: state\nsize: 13\ntrailing: 0\nfields:\n  version: 1\n"
                             "  standardModeStartTimestamp: 0\n  lockedInRestrictedMode: 1\n";
    const std::string file = root.path() / "state";
    std::ofstream(file, std::ios::binary) << state;
    const std::string digits = system_tests::hex(state);
    EXPECT_EQ(kstctl({"decode", digits}).out, text);
    EXPECT_EQ(kstctl({"decode", digits.substr(0, 8), digits.substr(8)}).out, text);
    EXPECT_EQ(kstctl({"decode", "--file", file}).out, text);
    EXPECT_EQ(kstctl({"decode", "--file", "-"}, {.input = state}).out, text);
    EXPECT_EQ(kstctl({"decode"}, {.input = state}).out, text);
    EXPECT_EQ(kstctl({"decode", "--hex"}, {.input = digits + "\n"}).out, text);
    EXPECT_EQ(kstctl({"decode", "--kind", "state", digits + "ffff"}).out,
              std::regex_replace(text, std::regex("trailing: 0"),
                                 "trailing: 2 (bytes behind it, not looked at)"));
    const Value value = json({"decode", digits});
    EXPECT_EQ(pathsIn(value),
              (std::vector<std::string>{"fields", "fields.lockedInRestrictedMode",
                                        "fields.standardModeStartTimestamp", "fields.version",
                                        "kind", "size", "trailing"}));
    EXPECT_EQ(json({"decode", "--payload-of", "kernel-control", "0500000001"}),
              json({"decode", "--payload-of", "26", "05000000", "01"}));
}

TEST_F(KstctlCommandsTest, BytesThatAreNoneOfTheirKind) {
    expectFailure({"decode", "zz"}, 5, "no hexadecimal digits: another character at character 1");
    expectFailure({"decode", "00"}, 5,
                  "these bytes are of no kind that shows by itself; say which with --kind");
    expectFailure({"decode", "04000000" + std::string(56, '0')}, 5,
                  "these bytes may be of the kinds analytics, credential; say which with --kind");
    expectFailure({"decode", "--kind", "record", "00"}, 5,
                  "a notification record has 36 bytes, not 1");
    expectFailure({"decode", "44525343"}, 5,
                  "these bytes are of no kind that shows by itself; say which with --kind");
    expectFailure({"decode", "44524353"}, 5, "a command frame has at least 8 bytes, not 4");
    expectFailure({"decode", "--file", root.path()}, 5,
                  root.path().string() + " is not a regular file");
    const std::string input(1024 * 1024 + 1, '0');
    expectFailure({"decode"}, 5, "standard input: longer than 1048576 bytes", {.input = input});
    std::ofstream(root.path() / "long") << input;
    expectFailure({"decode", "--file", root.path() / "long"}, 5,
                  (root.path() / "long").string() + ": longer than 1048576 bytes");
}

TEST_F(KstctlCommandsTest, PassphraseIsNotSaid) {
    const std::string secret = system_tests::hex("open sesame");
    const std::string credential = "020000000100000000000000e8030000000000000000000000000000"
                                   "88000000010000000b000000" +
                                   secret + std::string(256 - secret.size(), '0');
    for (const Arguments& arguments :
         {Arguments{"decode", credential}, Arguments{"decode", "--kind", "requirement", credential},
          Arguments{"decode", "--payload-of", "6", std::string(32, '0') + credential + "02000000"},
          Arguments{"decode", "4452435305000000" + std::string(32, '0') + credential + "02000000"},
          Arguments{"decode", "4452435306000000" + std::string(32, '0') + credential},
          Arguments{"decode", "4452435307000000" + credential}}) {
        const Ran ran = kstctl(arguments);
        for (const std::string& said : {ran.out, ran.err}) {
            EXPECT_EQ(said.find(secret), std::string::npos);
            EXPECT_EQ(said.find("sesame"), std::string::npos);
        }
    }
    const std::string shown = kstctl({"decode", "--show-secrets", credential}).out;
    EXPECT_NE(shown.find("passphrase: " + secret + "\n"), std::string::npos);
    EXPECT_NE(kstctl({"decode", credential}).out.find("passphraseLength: 11\n"), std::string::npos);
}

TEST_F(KstctlCommandsTest, ColoursAreForTerminalsOnly) {
    const RunOptions terminal{.onTerminal = true, .environment = {"TERM=xterm"}};
    EXPECT_NE(kstctl({"decode", "00000000"}, terminal).out.find("\x1b[1mkind:\x1b[0m"),
              std::string::npos);
    for (const std::string variable : {"NO_COLOR=1", "TERM=dumb"}) {
        const Ran ran = kstctl({"decode", "00000000"},
                               {.onTerminal = true, .environment = {"TERM=xterm", variable}});
        EXPECT_EQ(ran.out.find('\x1b'), std::string::npos) << variable;
    }
    EXPECT_NE(kstctl({"decode", "00000000"},
                     {.onTerminal = true, .environment = {"TERM=xterm", "NO_COLOR="}})
                  .out.find('\x1b'),
              std::string::npos);
    EXPECT_EQ(kstctl({"--json", "decode", "00000000"}, terminal).out.find('\x1b'),
              std::string::npos);
}

TEST_F(KstctlCommandsTest, ResultThatCannotBeWritten) {
    expectFailure({"decode", "00000000"}, 1, "cannot write: No space left on device",
                  {.outputFile = "/dev/full"});
}

} // namespace
} // namespace kstctl
