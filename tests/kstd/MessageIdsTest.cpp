// Every class of log lines by lines that the code really writes.

#include "kstd/MessageIds.h"

#include "base/UnixAddress.h"
#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "kstd/Daemon.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/host/MessageClasses.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/KernelSocketConnection.h"
#include "platform/linux/LinuxConfigurationResource.h"
#include "platform/linux/LinuxEventStream.h"
#include "platform/linux/LinuxFiles.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/LinuxManagedSettings.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "platform/linux/LinuxUserDefaults.h"
#include "platform/linux/SettingsWatch.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "platform/linux/alarms/HelpedAlarmWaker.h"
#include "platform/linux/alarms/TimerAlarmWaker.h"
#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/StandardErrorCapture.h"
#include "tests/platform/linux/alarms/FakeAlarmHelper.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/SeqpacketServer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <fstream>
#include <map>
#include <regex>
#include <set>
#include <sys/socket.h>
#include <system_error>

struct sd_event;

namespace {

/// What making a run loop fails with, unless it is 0.
int runLoopError = 0;

} // namespace

// The linker puts this between the platform and the init system's library.
// NOLINTBEGIN(bugprone-reserved-identifier)
extern "C" int __real_sd_event_new(sd_event** made);
extern "C" int __wrap_sd_event_new(sd_event** made) {
    return runLoopError != 0 ? runLoopError : __real_sd_event_new(made);
}
// NOLINTEND(bugprone-reserved-identifier)

namespace kstd {
namespace {

using Texts = std::vector<std::string>;

constexpr std::chrono::seconds kPatient{30};

/// The fixtures as plain objects, for one line each.
struct DaemonParts : DaemonFixture {
    void TestBody() override {}
    using DaemonFixture::failRequest;
    using DaemonFixture::fake;
    using DaemonFixture::machine;
    using DaemonFixture::makeService;
};
struct LoggerParts : LoggerFixture {
    void TestBody() override {}
};

Texts joined(Texts first, const Texts& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

Texts daemonThatStarts() {
    DaemonParts parts;
    parts.fake.events.closeSources();
    EXPECT_EQ(Daemon(parts.fake.host(), {}).run(), 0);
    return parts.fake.log.texts();
}

Texts startWithoutFiles() {
    DaemonParts parts;
    parts.makeService()->start();
    return parts.fake.log.texts();
}

Texts saveThatFails() {
    DaemonParts parts;
    parts.fake.files.failures.open = true;
    static_cast<void>(parts.makeService()->saveDataBlob(kStatePath, {}));
    return parts.fake.log.texts();
}

Texts kernelThatRefuses() {
    DaemonParts parts;
    parts.failRequest(5, -42);
    static_cast<void>(parts.makeService()->onQuorvaneChanged());
    return parts.fake.log.texts();
}

Texts kernelThatIsNotThere() {
    DaemonParts parts;
    parts.machine.kernel.entryPresent = false;
    static_cast<void>(parts.makeService()->KSTPropertyWithName("KSTRMTimerRestarted"));
    return parts.fake.log.texts();
}

Texts startThatIsNotTold() {
    DaemonParts parts;
    parts.failRequest(3, -42);
    parts.makeService()->start();
    return parts.fake.log.texts();
}

Texts fileThatCannotBeOpened() {
    platform::FakeSystemLog log;
    static_cast<void>(platform::LinuxFiles(platform::Paths("/"), log)
                          .openForWriting("/nowhere/at/all", platform::ProtectionClass::none,
                                          platform::kNoClassOptions, 0600));
    return log.texts();
}

Texts kernelThatNobodyServes() {
    platform::FakeSystemLog log;
    static_cast<void>(platform::LinuxServiceRegistry("/nowhere/at/all", log).findByClassName("x"));
    return log.texts();
}

Texts kernelThatHasNoSuchEntry() {
    const support::TemporaryDirectory directory;
    platform::FakeSystemLog log;
    const support::SeqpacketServer server(directory.file("socket"),
                                          [](const support::SeqpacketServer::Peer& peer) {
                                              peer.send(support::reply(peer.receive(), 0, 0, ""));
                                          });
    static_cast<void>(platform::LinuxServiceRegistry(directory.file("socket"), log, kPatient)
                          .findByClassName("x"));
    return log.texts();
}

Texts kernelOfAnotherUser() {
    const support::TemporaryDirectory directory;
    platform::FakeSystemLog log;
    std::filesystem::permissions(directory.path(), std::filesystem::perms::all);
    const base::FileDescriptor listener(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const std::string path = directory.file("socket");
    const auto address = base::UnixAddress::of(path).value();
    EXPECT_EQ(::bind(listener.get(), address.get(), address.size()), 0);
    // Who listens is who serves.
    EXPECT_EQ(support::exitStatusOfChild(
                  [&] { return ::setuid(65534) == 0 && ::listen(listener.get(), 1) == 0 ? 0 : 1; }),
              0);
    static_cast<void>(platform::KernelSocketConnection(path, log, kPatient).connect());
    return log.texts();
}

/// The lines of an event that is logged, or uploaded, with these answers of the servers.
Texts logging(const std::function<void(LoggerParts&)>& arrange,
              const std::function<void(LoggerParts&)>& act) {
    LoggerParts parts;
    arrange(parts);
    act(parts);
    return parts.fake.log.texts();
}

void logEvent(LoggerParts& parts) {
    const platform::ValueMap attributes;
    TestLogger::logger(parts.fake.host())->logEventNamed("policy", &attributes);
}

void upload(LoggerParts& parts) {
    TestLogger::logger(parts.fake.host())->forceUploadWithError(nullptr);
}

void logDueEvent(LoggerParts& parts) {
    parts.logger();
    parts.setDueDate(LoggerParts::kNow - 1);
    logEvent(parts);
}

void putDirectoryForDatabase(LoggerParts& parts) {
    std::filesystem::create_directories(parts.databaseFile());
}

Texts databaseThatCannotBeOpened() {
    return logging(putDirectoryForDatabase, logEvent);
}

/// One that refuses every event.
Texts databaseThatCannotBeWritten() {
    return logging(
        [](LoggerParts& parts) {
            parts.logger();
            parts.onQueue([&] {
                auto& database = *parts.logger().fields.database;
                static_cast<void>(
                    database.executeSQL("create trigger no before insert on all_events begin "
                                        "select raise(fail, 'no'); end",
                                        {}));
                static_cast<void>(database.executeSQL("nonsense", {}));
                static_cast<void>(database.statementForSQL("nonsense"));
            });
        },
        logEvent);
}

Texts eventThatCannotBeStored() {
    return logging(
        [](LoggerParts& parts) {
            parts.logger().fields.metricsBase = platform::ValueMap{{"a", platform::Null()}};
        },
        logEvent);
}

Texts serverThatIsAcceptedByForce() {
    class Trust final : public platform::ServerTrust {
        [[nodiscard]] platform::TrustResult evaluate() override { return {}; }
    };
    return logging([](LoggerParts& parts) { parts.logger().setAllowsInsecureSplunkCert(true); },
                   [](LoggerParts& parts) {
                       Trust trust;
                       parts.logger().didReceiveChallenge(
                           {platform::kServerTrustMethod, 0, &trust},
                           [](platform::ChallengeDisposition, const auto&) {});
                   });
}

Texts uploadThatGets(const platform::FakeHTTPAnswer& answer) {
    return logging(
        [&](LoggerParts& parts) {
            parts.configureUploadLink();
            parts.fake.https.setAnswer("POST", LoggerParts::kUploadLink, answer);
        },
        upload);
}

Texts bagThatIs(const platform::FakeHTTPAnswer& answer) {
    return logging(
        [&](LoggerParts& parts) {
            parts.configureBagLink();
            parts.fake.https.setAnswer("GET", LoggerParts::kBagLink, answer);
            parts.fake.https.setAnswer("POST", LoggerParts::kBagLink,
                                       platform::FakeHTTPAnswer::status(200));
        },
        upload);
}

platform::FakeHTTPAnswer failure(const char* description) {
    return platform::FakeHTTPAnswer::failure(platform::kCannotConnect, description);
}

constexpr char kNotTrusted[] = "server not trusted: self-signed certificate";

Texts serverThatIsNotTrusted() {
    return joined(uploadThatGets(failure(kNotTrusted)), bagThatIs(failure(kNotTrusted)));
}

Texts uploadsThatFail() {
    return joined(joined(uploadThatGets(failure("cannot connect: connection refused")),
                         uploadThatGets(platform::FakeHTTPAnswer::status(500))),
                  uploadThatGets(platform::FakeHTTPAnswer::notHTTP("Response")));
}

Texts dueUploadWithoutADatabase() {
    return logging(
        [](LoggerParts& parts) {
            parts.configureUploadLink();
            parts.logger().onUpload = [&parts] {
                parts.onQueue([&] { parts.logger().fields.database->close(); });
                std::filesystem::remove(parts.databaseFile());
                putDirectoryForDatabase(parts);
                return platform::ValueMap();
            };
        },
        logDueEvent);
}

Texts uploadsThatAreDisabled() {
    return bagThatIs(platform::FakeHTTPAnswer::status(200, R"({"disabled":true})"));
}

Texts noUploadAddress() {
    return joined(logging([](LoggerParts&) {}, upload),
                  bagThatIs(platform::FakeHTTPAnswer::status(200, "[]")));
}

/// Datagrams, and whatever else, on an event socket of the real host.
Texts eventsOnTheSocket(const std::vector<std::string>& datagrams, uid_t sender = ::geteuid()) {
    const support::TemporaryDirectory directory;
    std::filesystem::permissions(directory.path(), std::filesystem::perms::all);
    const std::string path = directory.file("socket");
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    platform::LinuxEventStream events(loop, log);
    platform::EventSocket socket(platform::makeEventSocket(path), loop, log,
                                 [&](const wire::EventDatagram& event) {
                                     events.post({std::string(event.stream), {}});
                                 });
    std::filesystem::permissions(path, std::filesystem::perms::all);
    EXPECT_EQ(support::exitStatusOfChild([&] {
                  const int sending = ::socket(AF_UNIX, SOCK_DGRAM, 0);
                  const auto address = base::UnixAddress::of(path).value();
                  bool sent = ::setuid(sender) == 0;
                  for (const std::string& datagram : datagrams) {
                      sent = sent && ::sendto(sending, datagram.data(), datagram.size(), 0,
                                              address.get(), address.size()) >= 0;
                  }
                  return sent ? 0 : 1;
              }),
              0);
    for (std::size_t i = 0; i < 2 * datagrams.size(); ++i) {
        EXPECT_TRUE(loop.runOnce({0}));
    }
    return log.texts();
}

Texts malformedEvents() {
    const auto unknown = wire::encodeEvent("unknown", "name").value();
    return eventsOnTheSocket({"", "text", std::string(wire::kEventMaxSize + 1, 'x'),
                              std::string(unknown.begin(), unknown.end())});
}

/// What a real host writes to standard error.
Texts hostWithoutASocket() {
    const support::RootDirectory root;
    root.makeDirectory("/etc");
    const support::StandardErrorCapture standardError;
    const platform::LinuxHost host({.paths = root.paths()});
    return standardError.lines();
}

/// No run loop can be made. A limit on the process would be met by the sanitizers, too.
Texts hostWithoutDescriptors() {
    const support::RootDirectory root;
    const support::StandardErrorCapture standardError;
    runLoopError = -EMFILE;
    EXPECT_THROW(platform::LinuxHost({.paths = root.paths()}), std::system_error);
    runLoopError = 0;
    EXPECT_EQ(standardError.lines(),
              Texts{"kstd: cannot start: the run loop: Too many open files."});
    return standardError.lines();
}

Texts socketThatCannotBeReceivedFrom() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(::pipe(ends), 0);
    const base::FileDescriptor writing(ends[1]);
    EXPECT_EQ(::write(ends[1], "x", 1), 1);
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    platform::EventSocket socket(base::FileDescriptor{ends[0]}, loop, log,
                                 [](const wire::EventDatagram&) {});
    EXPECT_TRUE(loop.runOnce({0}));
    return log.texts();
}

Texts settingsThatAreNotUsed() {
    const support::RootDirectory root;
    root.makeDirectory("/etc/kstd");
    platform::FakeSystemLog log;
    platform::LinuxManagedSettings settings(root.paths(), log);
    root.put("/etc/kstd/managed-settings.conf", "restricted-mode-allowed = perhaps\n");
    EXPECT_TRUE(settings.isRestrictedModeAllowed());
    root.put("/etc/kstd/managed-settings.conf", "unknown = 1\n");
    EXPECT_TRUE(settings.isRestrictedModeAllowed());
    return log.texts();
}

Texts settingsThatAreNotWatched() {
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    const platform::SettingsWatch watch("/nowhere/at/all", loop, log, [] {});
    return log.texts();
}

Texts configurationThatIsNotUsed() {
    const support::RootDirectory root;
    platform::FakeSystemLog log;
    platform::PropertyListCodec propertyLists;
    for (const char* const directory : {"/etc/kstd", "/usr/share/c"}) {
        root.makeDirectory(directory);
        root.put(std::string(directory) + "/d.plist", "no property list");
    }
    static_cast<void>(platform::LinuxUserDefaults(root.paths(), propertyLists, log).load("d"));
    static_cast<void>(
        platform::LinuxConfigurationResource(root.paths(), propertyLists, log).load("c", "d"));
    return log.texts();
}

Texts uploadSettingsThatAreInDoubt() {
    platform::FakeSystemLog log;
    platform::FakeConfigurationResource resources;
    platform::FakeUserDefaults defaults;
    for (const char* const link : {"no link", "https://user@x.example/", "http://x.example/"}) {
        defaults.set("com.zerva.keystrand.analytics", "splunk_uploadURL", link);
        AnalyticsConfiguration::read(resources, defaults).report(log);
    }
    return log.texts();
}

Texts alarmThatIsNotKept() {
    platform::FakeSystemLog log;
    EXPECT_FALSE(
        platform::AlarmStore("/proc/nowhere", {"event"}, log).save("stream", "event", {1}));
    return log.texts();
}

/// An alarm whose helper answers so, or is not there.
Texts alarmWith(const std::optional<wire::AlarmAnswer>& answer) {
    const support::TemporaryDirectory directory;
    const std::string path = directory.file("socket");
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    platform::TimerAlarmWaker inProcess(loop, [] {});
    platform::HelpedAlarmWaker waker(path, loop, inProcess, log, std::chrono::microseconds(1));
    std::optional<platform::FakeAlarmHelper> helper;
    if (answer) {
        helper.emplace(path);
    }
    waker.arm(platform::kDistantFuture);
    if (answer) {
        helper->question().value().answer(*answer);
    }
    while (inProcess.holdsProcess() && log.texts().empty() &&
           loop.runOnce(platform::kDistantFuture)) {
    }
    return log.texts();
}

Texts alarmWithoutAHelper() {
    return alarmWith(std::nullopt);
}

Texts alarmThatDoesNotWake() {
    return alarmWith(wire::AlarmAnswer{
        wire::AlarmAnswer::Timer::waits, false, platform::kDistantFuture.nanosecondsSince1970, {}});
}

struct Example {
    const char* name;
    std::string_view id;
    Texts (*lines)();
    bool needsRoot = false;
};

const std::vector<Example> kExamples = {
    {"daemonThatStarts", message::kDaemonStarted, daemonThatStarts},
    {"startWithoutFiles", message::kStateFileNotLoaded, startWithoutFiles},
    {"saveThatFails", message::kStateFileNotSaved, saveThatFails},
    {"kernelThatRefuses", message::kKernelServiceFailed, kernelThatRefuses},
    {"kernelThatIsNotThere", message::kKernelServiceFailed, kernelThatIsNotThere},
    {"kernelThatNobodyServes", message::kKernelServiceFailed, kernelThatNobodyServes},
    {"kernelThatHasNoSuchEntry", message::kKernelServiceFailed, kernelThatHasNoSuchEntry},
    {"startThatIsNotTold", message::kKernelSideNotTold, startThatIsNotTold},
    {"settingThatIsNotTold", message::kKernelSideNotTold, kernelThatRefuses},
    {"fileThatCannotBeOpened", message::kStateFileFailed, fileThatCannotBeOpened},
    {"eventThatCannotBeStored", message::kEventNotStored, eventThatCannotBeStored},
    {"serverThatIsChallenged", message::kServerChallenge, serverThatIsAcceptedByForce},
    {"serverThatIsAcceptedByForce", message::kServerAccepted, serverThatIsAcceptedByForce},
    {"uploadsThatAreDisabled", message::kUploadsDisabled, uploadsThatAreDisabled},
    {"kernelOfAnotherUser", message::kKernelServiceNotTrusted, kernelOfAnotherUser, true},
    {"databaseThatCannotBeOpened", message::kDatabaseNotOpened, databaseThatCannotBeOpened},
    {"databaseThatCannotBeWritten", message::kDatabaseFailed, databaseThatCannotBeWritten},
    {"serverThatIsNotTrusted", message::kServerNotTrusted, serverThatIsNotTrusted},
    {"uploadsThatFail", message::kUploadFailed, uploadsThatFail},
    {"dueUploadWithoutADatabase", message::kUploadFailed, dueUploadWithoutADatabase},
    {"noUploadAddress", message::kNoUploadAddress, noUploadAddress},
    {"eventOfAnotherUser", message::kForeignEvent,
     [] { return eventsOnTheSocket({"text"}, 65534); }, true},
    {"malformedEvents", message::kMalformedEvent, malformedEvents},
    {"hostWithoutASocket", message::kNoEventSocket, hostWithoutASocket},
    {"hostWithoutDescriptors", message::kCannotStart, hostWithoutDescriptors},
    {"socketThatCannotBeReceivedFrom", message::kNoEventSocket, socketThatCannotBeReceivedFrom},
    {"settingsThatAreNotUsed", message::kSettingsNotUsed, settingsThatAreNotUsed},
    {"settingsThatAreNotWatched", message::kSettingsNotWatched, settingsThatAreNotWatched},
    {"configurationThatIsNotUsed", message::kConfigurationNotUsed, configurationThatIsNotUsed},
    {"uploadSettingsThatAreInDoubt", message::kUploadSettingInDoubt, uploadSettingsThatAreInDoubt},
    {"alarmThatIsNotKept", message::kAlarmNotKept, alarmThatIsNotKept},
    {"alarmWithoutAHelper", message::kAlarmWithoutInitSystem, alarmWithoutAHelper},
    {"alarmThatDoesNotWake", message::kAlarmDoesNotWake, alarmThatDoesNotWake},
};

/// The pattern that gives a line its class; none when it is of none.
const platform::MessageClass* classOf(const std::string& line) {
    const auto classes = messageClasses();
    const auto found = std::find_if(classes.begin(), classes.end(), [&](const auto& candidate) {
        return platform::isOfPattern(line, candidate.pattern);
    });
    return found == classes.end() ? nullptr : &*found;
}

std::string text(const Texts& lines) {
    std::string all;
    for (const std::string& line : lines) {
        all += line + '\n';
    }
    return all;
}

TEST(MessageIdsTest, EveryPatternFitsALineThatIsWritten) {
    std::set<const platform::MessageClass*> unseen;
    for (const auto& known : messageClasses()) {
        unseen.insert(&known);
    }
    for (const Example& example : kExamples) {
        SCOPED_TRACE(example.name);
        if (example.needsRoot && ::geteuid() != 0) {
            std::erase_if(unseen, [&](const auto* known) { return known->id == example.id; });
            continue;
        }
        const Texts lines = example.lines();
        bool isOfClass = false;
        for (const std::string& line : lines) {
            const platform::MessageClass* const found = classOf(line);
            unseen.erase(found);
            isOfClass |= found != nullptr && found->id == example.id;
        }
        EXPECT_TRUE(isOfClass) << text(lines);
    }
    for (const auto* const known : unseen) {
        ADD_FAILURE() << "no line begins like: " << known->pattern;
    }
}

TEST(MessageIdsTest, OtherLinesAreOfNone) {
    for (const char* const line :
         {"kstd: main: Started service - <DeviceRestrictedModeService>.",
          "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: called, filePath = /x.",
          "kstd: main_block_invoke: Wisp Event: kstd: EventSocket: dropped (notifyd).",
          "Splunk upload success", "TQAnalyticsLogger: db is closed, attempting to open", ""}) {
        EXPECT_EQ(classOf(line), nullptr) << line;
    }
}

TEST(MessageIdsTest, IdentifiersAreThoseOfTheCatalog) {
    std::set<std::string> known;
    for (const auto& messageClass : messageClasses()) {
        EXPECT_TRUE(std::regex_match(std::string(messageClass.id), std::regex("[0-9a-f]{32}")));
        known.emplace(messageClass.id);
    }
    std::set<std::string> explained;
    std::ifstream catalog(SOURCE_ROOT "/packaging/systemd/kstd.catalog");
    for (std::string line; std::getline(catalog, line);) {
        if (line.starts_with("-- ")) {
            EXPECT_TRUE(explained.insert(line.substr(3)).second) << "twice: " << line;
        }
    }
    EXPECT_EQ(known, explained);
    EXPECT_EQ(known.size(), 27U);
}

} // namespace
} // namespace kstd
