// The gate in front of the USB ports as kstctl shows and orders it: the other end is a real gate on
// a bus of the test's, or answers as it likes.

#include "base/Concat.h"
#include "keystrand-linux/GateSocket.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Report.h"
#include "kstctl/status/GateClient.h"
#include "platform/formats/JSONCodec.h"
#include "platform/linux/LinuxClock.h"
#include "tests/keystrand-linux/FakeUsbBus.h"
#include "tests/keystrand-linux/MachineDoubles.h"
#include "tests/kstctl/KstctlFixture.h"
#include "tests/kstctl/PacketServer.h"
#include "wire/SystemPaths.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>
#include <sys/socket.h>

namespace kstctl {
namespace {

namespace fs = std::filesystem;

using namespace std::chrono_literals;
using base::concat;
using platform::Null;
using platform::Value;

/// A text with T for each time in it.
std::string withoutTimes(const std::string& text) {
    return std::regex_replace(text, std::regex(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\dZ)"), "T");
}

class GateTest : public KstctlFixture {
  protected:
    GateTest() { fs::create_directories(real("/run/keystrand")); }

    [[nodiscard]] std::string path() const { return real(wire::kGateSocket); }

    /// Answers each request with the next of these, and hangs up when there are no more.
    [[nodiscard]] PacketServer serve(std::vector<std::string> answers) const {
        return PacketServer(path(), [answers = std::move(answers),
                                     next = std::size_t{0}](const std::string&) mutable {
            return next < answers.size() ? std::optional(answers[next++]) : std::nullopt;
        });
    }
    [[nodiscard]] PacketServer serveStatus(const wire::GateStatus& status,
                                           const wire::GateDevices& devices = {}) const {
        return serve({wire::encodeGateAnswer(status), wire::encodeGateAnswer(devices)});
    }
    /// What `status` shows of it; the daemon is not there.
    Value gate() { return at(json({"status"}, 3), "gate"); }
};

/// Keystrand itself, but for its socket.
class RealGateTest : public GateTest {
  protected:
    RealGateTest() {
        bus.addRootHub(1);
        bus.plug("1-1", keystrand::usb::aMouse());
        keystrand.start();
        bus.plug("1-2", keystrand::usb::aDisk());
    }

    using AfterAnswer = std::function<void(const wire::GateRequest& request)>;

    Ran ask(
        const Arguments& arguments, const AfterAnswer& then = [](const auto&) {}) {
        const PacketServer server(path(), [&](const std::string& packet) {
            const auto request = wire::decodeGateRequest(packet);
            const auto answered = answer(keystrand, clocks, *request);
            then(*request);
            return std::optional(wire::encodeGateAnswer(answered));
        });
        return kstctl(arguments);
    }
    Value askJSON(const Arguments& arguments) {
        Arguments all = arguments;
        all.emplace_back("--json");
        const Ran ran = ask(all);
        EXPECT_EQ(ran.status, 0) << ran.err;
        return platform::readJSON(ran.out.substr(0, ran.out.size() - 1)).value();
    }

    support::TemporaryDirectory directory;
    keystrand::usb::StateFile record{directory.file("gate"),
                                     keystrand::usb::StateFile::Durability::none};
    keystrand::usb::StateFile known{directory.file("devices"),
                                    keystrand::usb::StateFile::Durability::none};
    keystrand::usb::FakeUsbBus bus;
    keystrand::usb::Clocks clocks;
    keystrand::usb::Sessions sessions;
    keystrand::usb::Poster poster;
    keystrand::usb::Log log;
    keystrand::KernelState kernelState;
    keystrand::usb::Keystrand keystrand{
        keystrand::usb::Keystrand::Parts{
            .kernel = kernelState,
            .events = poster,
            .clock = clocks,
            .lockState = sessions,
            .bus = bus,
            .record = record,
            .devices = known,
            .log = log,
            .switches = [] { return keystrand::usb::PolicySwitches(); },
            .sleepAgain = [] {},
            .rearm =
                [] {
                }},
        keystrand::usb::Keystrand::Settings{}};
};

TEST_F(RealGateTest, ListsDevices) {
    EXPECT_EQ(withoutTimes(ask({"devices"}).out),
              "PORT  ID         STATE     SINCE                 PRODUCT      RULE\n"
              "1-1   1111:2222  accepted  T  maker mouse  attached before the gate closed\n"
              "1-2   1111:2222  refused   T  maker disk   came while the gate was closed\n");
    clocks.pass(7s);
    const auto before = platform::realTimeNow().nanosecondsSince1970;
    const Value devices = at(askJSON({"devices"}), "devices");
    const auto after = platform::realTimeNow().nanosecondsSince1970;
    const auto attachment = bus.attachmentAt("1-2");
    const std::pair<std::string, Value> kExpected[] = {
        {"1.port", "1-2"},
        {"1.number", std::int64_t{attachment.number}},
        {"1.inode", static_cast<std::int64_t>(attachment.inode)},
        {"1.id", "1111:2222"},
        {"1.manufacturer", "maker"},
        {"1.name", "disk"},
        {"1.serial", ""},
        {"1.classes", "08/06/50"},
        {"1.isAccepted", false},
        {"1.rule", "refused"},
        {"1.ruleText", "came while the gate was closed"},
        {"0.isAccepted", true},
        {"0.rule", "attached"},
        {"2", "there is no 2"},
    };
    for (const auto& [where, value] : kExpected) {
        EXPECT_EQ(at(devices, where), value) << where;
    }
    const auto text = [](std::int64_t nanoseconds) {
        return timeText(platform::Date{nanoseconds - 7 * platform::kNanosecondsPerSecond});
    };
    const Value since = at(devices, "1.since");
    EXPECT_GE(*since.as<std::string>(), text(before));
    EXPECT_LE(*since.as<std::string>(), text(after));
}

TEST_F(RealGateTest, HasNoRulesWhileItIsOpen) {
    keystrand.openFor(60s);
    EXPECT_EQ(ask({"devices"}).out, "PORT  ID         STATE     SINCE  PRODUCT      RULE\n"
                                    "1-1   1111:2222  accepted         maker mouse\n"
                                    "1-2   1111:2222  accepted         maker disk\n");
    const Value devices = at(askJSON({"devices"}), "devices");
    EXPECT_EQ(at(devices, "0.rule"), Value(Null()));
    EXPECT_EQ(at(devices, "0.since"), Value(Null()));
}

TEST_F(RealGateTest, AcceptsTheDeviceAtAPort) {
    const auto attachment = bus.attachmentAt("1-2");
    EXPECT_EQ(ask({"devices", "accept", "1-2"}).out,
              concat("port: 1-2\nnumber: ", attachment.number, "\ninode: ", attachment.inode,
                     "\nid: 1111:2222\nmanufacturer: maker\nname: disk\nserial: \n"
                     "classes: 08/06/50\nisAccepted: yes\n"));
    EXPECT_TRUE(bus.isAuthorized("1-2"));
    Ran ran = ask({"devices", "accept", "1-2"});
    EXPECT_EQ(ran.status, 1);
    EXPECT_EQ(ran.err, "kstctl: the device at port 1-2 is accepted already\n");
    ran = ask({"devices", "accept", "1-3"});
    EXPECT_EQ(ran.status, 3);
    EXPECT_EQ(ran.err, "kstctl: there is no device at port 1-3\n");
}

TEST_F(RealGateTest, DoesNotAcceptWhatHasComeInTheDevicesPlace) {
    const Ran ran = ask({"devices", "accept", "1-2"}, [this](const wire::GateRequest& request) {
        if (std::holds_alternative<wire::GateDevicesRequest>(request)) {
            bus.replug("1-2");
        }
    });
    EXPECT_EQ(ran.status, 1);
    EXPECT_EQ(ran.err, "kstctl: keystrand: the device is not there any more\n");
    EXPECT_EQ(ran.out, "");
    EXPECT_FALSE(bus.isAuthorized("1-2"));
}

TEST_F(RealGateTest, OpensAndEndsThat) {
    EXPECT_EQ(withoutTimes(ask({"open", "--for", "10min"}).out), "seconds: 600 (open until T)\n");
    EXPECT_EQ(bus.rootHubDefault(1), keystrand::usb::kEverybody);
    EXPECT_EQ(keystrand.status().untilClosed, 600s);
    const Value ended = askJSON({"open", "--for", "0"});
    EXPECT_EQ(at(ended, "seconds"), Value(std::int64_t{0}));
    EXPECT_EQ(at(ended, "secondsText"), Value("no longer opened"));
    EXPECT_EQ(bus.rootHubDefault(1), keystrand::usb::kHardWiredOnly);
}

TEST_F(RealGateTest, IsInTheStatus) {
    Ran ran = ask({"status"});
    EXPECT_EQ(ran.status, 3);
    const auto attachment = bus.attachmentAt("1-2");
    EXPECT_EQ(withoutTimes(ran.out.substr(ran.out.find("gate:\n"))),
              concat("gate:\n  path: ", path(),
                     "\n  mode: closed (the machine has just started)\n  isRestricted: no\n"
                     "  isStarting: yes\n  isSleeping: no\n  isLocked: yes\n"
                     "  untilRestricted: 3600 (T)\n  untilClosed: none\n  policy: on\n"
                     "  refused: 1\n  refusedDevices:\n"
                     "    - port: 1-2\n      number: ",
                     attachment.number, "\n      inode: ", attachment.inode,
                     "\n      id: 1111:2222\n      manufacturer: maker\n      name: disk\n"
                     "      serial: \n      classes: 08/06/50\n      isAccepted: no\n"
                     "      rule: refused (came while the gate was closed)\n      since: T\n"));
}

// With a gate that answers as the test likes.

TEST_F(GateTest, TimesToOpenFor) {
    const std::pair<const char*, std::uint32_t> kTimes[] = {
        {"0", 0},    {"0s", 0},    {"0h", 0},           {"1s", 1},        {"001s", 1},
        {"90s", 90}, {"1min", 60}, {"604800s", 604800}, {"168h", 604800}, {"10080min", 604800}};
    for (const auto& [time, seconds] : kTimes) {
        PacketServer server = serve({wire::encodeGateAnswer(wire::GateDone())});
        EXPECT_EQ(kstctl({"open", "--for", time}).status, 0) << time;
        EXPECT_EQ(server.stop(),
                  std::vector{wire::encodeGateRequest(wire::GateOpenRequest{.seconds = seconds})})
            << time;
    }
    for (const char* const time :
         {"604801s", "169h", "10081min", "4294967296s", "99999999999999999999h"}) {
        expectFailure({"open", "--for", time}, 2,
                      concat("--for: Value ", time, " is longer than 168h"));
    }
    for (const char* const time : {"1", "h", "min", "1m", "1 h", "-1s", "+1s", "1.5h", "1h30"}) {
        expectFailure({"open", concat("--for=", time)}, 2,
                      concat("--for: Value ", time, " is no time such as 30s, 10min or 2h"));
    }
    expectFailure({"open"}, 2, "--for is required");
}

TEST_F(GateTest, PortsToAccept) {
    for (const char* const port : {"1-2", "12-3.4.5"}) {
        const PacketServer server = serve({wire::encodeGateAnswer(wire::GateDevices())});
        expectFailure({"devices", "accept", port}, 3, concat("there is no device at port ", port));
    }
    for (const char* const port :
         {"1", "1-", "-1", "1-2.", "1-.2", "1-2..3", "usb1", "1-2 3", "1.2"}) {
        expectFailure({"devices", "accept", "--", port}, 2,
                      concat("port: Value ", port, " is no port such as 1-2 or 1-2.3"));
    }
    expectFailure({"devices", "accept"}, 2, "port is required");
}

TEST_F(GateTest, DevicesThatAreMeantToMislead) {
    const PacketServer server =
        serve({wire::encodeGateAnswer(wire::GateDevices{{.port = "1-2",
                                                         .vendor = 0xab,
                                                         .name = "\x1b[2J\nx",
                                                         .serial = "\xff",
                                                         .rule = "of-tomorrow"}})});
    EXPECT_EQ(withoutTimes(kstctl({"devices"}).out),
              "PORT  ID         STATE    SINCE                 PRODUCT     RULE\n"
              "1-2   00ab:0000  refused  T  \\x1b[2J\\nx  of-tomorrow\n");
}

TEST_F(GateTest, ModesInTheStatus) {
    struct Mode {
        wire::GateStatus status;
        const char* mode;
        Value meaning;
    };
    const Value nothing("there is no modeText");
    const Mode kModes[] = {
        {{}, "open", nothing},
        {{.locked = true, .untilRestricted = 5}, "open", nothing},
        {{.locked = true, .restricted = true, .closed = true}, "closed", "restricted mode"},
        {{.sleeping = true, .restricted = true, .closed = true},
         "closed",
         "restricted mode, the machine sleeps"},
        {{.starting = true, .closed = true}, "closed", "the machine has just started"},
        {{.restricted = true, .untilClosed = 5}, "open", "by an administrator"},
        {{.allowed = false}, "open", "the policy is off"},
        {{.sleeping = true, .bootArgument = true}, "open", "the policy is off"},
        {{.restricted = true}, "open", "it could not be closed"},
        {{.restricted = true, .closed = true, .gap = "root hub usb2"},
         "partly closed",
         "restricted mode"},
    };
    for (const Mode& mode : kModes) {
        const PacketServer server = serveStatus(mode.status);
        const Value shown = gate();
        EXPECT_EQ(at(shown, "mode"), Value(mode.mode));
        EXPECT_EQ(at(shown, "modeText"), mode.meaning);
        EXPECT_EQ(at(shown, "isRestricted"), Value(mode.status.restricted));
        EXPECT_EQ(at(shown, "isStarting"), Value(mode.status.starting));
        EXPECT_EQ(at(shown, "isSleeping"), Value(mode.status.sleeping));
        EXPECT_EQ(at(shown, "isLocked"), Value(mode.status.locked));
        const auto seconds = [](const std::optional<std::uint64_t>& time) {
            return time ? Value(static_cast<std::int64_t>(*time)) : Value(Null());
        };
        EXPECT_EQ(at(shown, "untilRestricted"), seconds(mode.status.untilRestricted));
        EXPECT_EQ(at(shown, "untilClosed"), seconds(mode.status.untilClosed));
        EXPECT_EQ(at(shown, "refusedDevices"), Value(platform::ValueList()));
        EXPECT_EQ(at(shown, "exceptions"), mode.status.gap.empty() ? Value("there is no exceptions")
                                                                   : Value(mode.status.gap));
    }
}

TEST_F(GateTest, WhyThePolicyIsOff) {
    const std::pair<wire::GateStatus, Value> kReasons[] = {
        {{.allowed = false}, "the management does not allow it"},
        {{.passwordSet = false}, "the user has no password"},
        {{.bootArgument = true}, "the kernel's command line says so"},
        {{.allowed = false, .passwordSet = false, .bootArgument = true},
         "the management does not allow it, the user has no password, "
         "the kernel's command line says so"},
    };
    for (const auto& [status, reason] : kReasons) {
        const PacketServer server = serveStatus(status);
        const Value shown = gate();
        EXPECT_EQ(at(shown, "policy"), Value("off"));
        EXPECT_EQ(at(shown, "policyText"), reason);
    }
    const PacketServer server = serveStatus({});
    EXPECT_EQ(at(gate(), "policy"), Value("on"));
}

TEST_F(GateTest, OfTheDevicesTheStatusShowsThoseThatAreRefused) {
    const PacketServer server = serveStatus({.closed = true, .refused = 1},
                                            {{.port = "1-1", .accepted = true, .rule = "attached"},
                                             {.port = "1-2", .rule = "refused"}});
    const Value shown = gate();
    EXPECT_EQ(at(shown, "refused"), Value(std::int64_t{1}));
    EXPECT_EQ(at(shown, "refusedDevices.0.port"), Value("1-2"));
    EXPECT_EQ(at(shown, "refusedDevices.1"), Value("there is no 1"));
}

TEST_F(GateTest, MachineWithoutAGate) {
    EXPECT_EQ(gate(), Value("there is no gate"));
    const std::string none = concat("there is no gate socket at ", path(),
                                    "; keystrand is not installed, or does not run");
    for (const Arguments& arguments : {Arguments{"devices"}, Arguments{"devices", "accept", "1-2"},
                                       Arguments{"open", "--for", "1s"}}) {
        expectFailure(arguments, 3, none);
    }
}

TEST_F(GateTest, GateThatDoesNotRun) {
    // As a killed one leaves it.
    { const PacketServer server(path(), nullptr); }
    const std::string nobody = concat("nobody listens at ", path(), "; keystrand does not run");
    expectFailure({"devices"}, 3, nobody);
    const Value shown = gate();
    EXPECT_EQ(at(shown, "path"), Value(path()));
    EXPECT_EQ(at(shown, "mode"), Value(Null()));
    EXPECT_EQ(at(shown, "modeUnknown"), Value(nobody));
}

TEST_F(GateTest, SocketThatIsNone) {
    const std::string none = path() + " is no gate socket";
    std::ofstream(path()).close();
    expectFailure({"devices"}, 5, none);
    EXPECT_EQ(at(gate(), "modeUnknown"), Value(none));
    fs::remove(path());
    const PacketServer server(path(), nullptr, SOCK_STREAM);
    expectFailure({"open", "--for", "1s"}, 5, none);
}

TEST_F(GateTest, AnswersThatAreNone) {
    const std::string devices = wire::encodeGateAnswer(wire::GateDevices());
    const std::string device = wire::encodeGateAnswer(wire::GateDevices{{.port = "1-2"}});
    struct Wrong {
        std::vector<std::string> answers;
        Arguments arguments;
        int status;
        const char* line;
    };
    const char kUnclear[] = "keystrand's answer cannot be understood";
    const char kOther[] = "keystrand has answered something else than was asked for";
    const char kHungUp[] = "keystrand has hung up without an answer";
    const Wrong kWrong[] = {
        {{}, {"devices"}, 1, kHungUp},
        {{"nonsense"}, {"devices"}, 5, kUnclear},
        {{devices + std::string(wire::kGateAnswerSize, 'x')}, {"devices"}, 5, kUnclear},
        {{"ok\n"}, {"devices"}, 5, kOther},
        {{"error not understood\n"}, {"devices"}, 1, "keystrand: not understood"},
        {{"error a\x1b b\n"}, {"devices"}, 1, "keystrand: a\\x1b b"},
        {{device}, {"devices", "accept", "1-2"}, 1, kHungUp},
        {{device, device}, {"devices", "accept", "1-2"}, 5, kOther},
        {{device, "error the device could not be accepted\n"},
         {"devices", "accept", "1-2"},
         1,
         "keystrand: the device could not be accepted"},
        {{devices}, {"open", "--for", "1s"}, 5, kOther},
        {{"error no\n"}, {"open", "--for", "1s"}, 1, "keystrand: no"},
    };
    for (const Wrong& wrong : kWrong) {
        const PacketServer server = serve(wrong.answers);
        expectFailure(wrong.arguments, wrong.status, wrong.line);
        EXPECT_EQ(kstctl(wrong.arguments).out, "");
    }
    {
        const PacketServer server = serve({"nonsense"});
        EXPECT_EQ(at(gate(), "modeUnknown"), Value(kUnclear));
    }
    const PacketServer server = serve({wire::encodeGateAnswer(wire::GateStatus())});
    const Value shown = gate();
    EXPECT_EQ(at(shown, "mode"), Value("open"));
    EXPECT_EQ(at(shown, "refusedDevices"), Value(Null()));
    EXPECT_EQ(at(shown, "refusedDevicesUnknown"), Value(kHungUp));
}

TEST_F(GateTest, GateThatDoesNotAnswer) {
    // Nobody takes what waits here.
    const base::FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(path()).value();
    ASSERT_EQ(::bind(socket.get(), address.get(), address.size()), 0);
    ASSERT_EQ(::listen(socket.get(), 0), 0);
    const platform::Paths paths(root.path().string());
    auto first = GateClient::connect(paths, 1ms);
    ASSERT_TRUE(first);
    const auto answer = std::move(first).value().status();
    ASSERT_FALSE(answer);
    EXPECT_EQ(statusOf(answer.error()), ExitStatus::failed);
    EXPECT_EQ(answer.error().description, "keystrand does not answer");
    // That one waits; there is no room for another.
    expectFailure({"devices"}, 1, concat("too many wait at ", path(), " already"));
}

TEST(GateRulesTest, EachHasWordsAndThereAreNoMore) {
    using keystrand::usb::Standing;
    std::ifstream file(SOURCE_ROOT "/docs/kstctl.md");
    const std::string page{std::istreambuf_iterator<char>(file), {}};
    const auto count = static_cast<std::size_t>(Standing::refusedByOthers) + 1;
    EXPECT_EQ(gateRules().size(), count);
    for (std::size_t number = 0; number < count; ++number) {
        const std::string_view word = nameOf(static_cast<Standing>(number));
        EXPECT_NE(meaningOfGateRule(word), "") << word;
        EXPECT_NE(page.find(concat("\n| `", word, "` ")), std::string::npos) << word;
    }
    EXPECT_EQ(meaningOfGateRule("of-tomorrow"), "");
}

TEST_F(GateTest, UserWhoMayNot) {
    if (::geteuid() != 0) {
        GTEST_SKIP() << "needs root, to become somebody else";
    }
    fs::permissions(root.path(), fs::perms(0755));
    const PacketServer server = serve({});
    fs::permissions(path(), fs::perms(0600));
    for (const Arguments& arguments : {Arguments{"devices"}, Arguments{"devices", "accept", "1-2"},
                                       Arguments{"open", "--for", "1s"}}) {
        expectFailure(arguments, 4, path() + ": Permission denied", {.user = 65534});
    }
    const Ran ran = kstctl({"status", "--json"}, {.user = 65534});
    EXPECT_NE(ran.out.find(concat("\"modeUnknown\":\"", path(), ": Permission denied\"")),
              std::string::npos)
        << ran.out;
}

} // namespace
} // namespace kstctl
