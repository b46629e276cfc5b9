// Every class of log lines, by lines that the code really writes: which of them are of a class, and
// of which.

#include "platform/MessageClasses.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "kstd/Analytics/AnalyticsConfiguration.h"
#include "kstd/Daemon.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/KernelSocketConnection.h"
#include "platform/linux/LinuxConfiguration.h"
#include "platform/linux/LinuxEventStream.h"
#include "platform/linux/LinuxFiles.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/LinuxManagedSettings.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "platform/linux/SettingsWatch.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "platform/linux/alarms/HelpedAlarmWaker.h"
#include "platform/linux/alarms/TimerAlarmWaker.h"
#include "tests/kstd/Analytics/LoggerFixture.h"
#include "tests/kstd/DaemonFixture.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/platform/linux/RootDirectory.h"
#include "tests/platform/linux/alarms/FakeAlarmHelper.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/SeqpacketServer.h"

#include <gmock/gmock.h>

#include <cerrno>
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

namespace message = platform::message;
using Lines = std::vector<platform::FakeSystemLog::Line>;

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

Lines joined(Lines first, const Lines& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

Lines daemonThatStarts() {
    DaemonParts parts;
    parts.fake.events.closeSources();
    EXPECT_EQ(Daemon(parts.fake.host(), {}).run(), 0);
    return parts.fake.log.lines();
}

Lines startWithoutFiles() {
    DaemonParts parts;
    parts.makeService()->start();
    return parts.fake.log.lines();
}

Lines saveThatFails() {
    DaemonParts parts;
    parts.fake.files.failures.open = true;
    static_cast<void>(parts.makeService()->saveDataBlob(kStatePath, {}));
    return parts.fake.log.lines();
}

Lines kernelThatRefuses() {
    DaemonParts parts;
    parts.failRequest(5, -42);
    static_cast<void>(parts.makeService()->onQuorvaneChanged());
    return parts.fake.log.lines();
}

Lines kernelThatIsNotThere() {
    DaemonParts parts;
    parts.machine.kernel.entryPresent = false;
    static_cast<void>(parts.makeService()->KSTPropertyWithName("KSTRMTimerRestarted"));
    return parts.fake.log.lines();
}

Lines startThatIsNotTold() {
    DaemonParts parts;
    parts.failRequest(3, -42);
    parts.makeService()->start();
    return parts.fake.log.lines();
}

Lines fileThatCannotBeOpened() {
    platform::FakeSystemLog log;
    static_cast<void>(platform::LinuxFiles(platform::Paths("/"), log)
                          .openForWriting("/nowhere/at/all", platform::ProtectionClass::none,
                                          platform::kNoClassOptions, 0600));
    return log.lines();
}

Lines kernelThatNobodyServes() {
    platform::FakeSystemLog log;
    static_cast<void>(platform::LinuxServiceRegistry("/nowhere/at/all", log).findByClassName("x"));
    return log.lines();
}

Lines kernelThatHasNoSuchEntry() {
    const support::TemporaryDirectory directory;
    platform::FakeSystemLog log;
    const support::SeqpacketServer server(directory.file("socket"),
                                          [](const support::SeqpacketServer::Peer& peer) {
                                              peer.send(support::reply(peer.receive(), 0, 0, ""));
                                          });
    static_cast<void>(platform::LinuxServiceRegistry(directory.file("socket"), log, kPatient)
                          .findByClassName("x"));
    return log.lines();
}

Lines kernelOfAnotherUser() {
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
    return log.lines();
}

/// The lines of an event that is logged, or uploaded, with these answers of the servers.
Lines logging(const std::function<void(LoggerParts&)>& arrange,
              const std::function<void(LoggerParts&)>& act) {
    LoggerParts parts;
    arrange(parts);
    act(parts);
    return parts.fake.log.lines();
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

Lines databaseThatCannotBeOpened() {
    return logging(putDirectoryForDatabase, logEvent);
}

/// One that refuses every event.
Lines databaseThatCannotBeWritten() {
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

Lines eventThatCannotBeStored() {
    return logging(
        [](LoggerParts& parts) {
            parts.logger().fields.metricsBase = platform::ValueMap{{"a", platform::Null()}};
        },
        logEvent);
}

Lines serverThatIsAcceptedByForce() {
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

Lines uploadThatGets(const platform::FakeHTTPAnswer& answer) {
    return logging(
        [&](LoggerParts& parts) {
            parts.configureUploadLink();
            parts.fake.https.setAnswer("POST", LoggerParts::kUploadLink, answer);
        },
        upload);
}

Lines bagThatIs(const platform::FakeHTTPAnswer& answer) {
    return logging(
        [&](LoggerParts& parts) {
            parts.configureBagLink();
            parts.fake.https.setAnswer("GET", LoggerParts::kBagLink, answer);
            parts.fake.https.setAnswer("POST", LoggerParts::kBagLink,
                                       platform::FakeHTTPAnswer::status(200));
        },
        upload);
}

platform::FakeHTTPAnswer failure(std::int64_t code, const char* description) {
    return platform::FakeHTTPAnswer::failure(code, description);
}

constexpr char kNotTrusted[] = "server not trusted: self-signed certificate";

Lines serverThatIsNotTrusted() {
    return joined(uploadThatGets(failure(platform::kTrustRefused, kNotTrusted)),
                  bagThatIs(failure(platform::kTrustRefused, kNotTrusted)));
}

Lines uploadsThatFail() {
    return joined(joined(uploadThatGets(failure(platform::kCannotConnect,
                                                "cannot connect: connection refused")),
                         uploadThatGets(platform::FakeHTTPAnswer::status(500))),
                  uploadThatGets(platform::FakeHTTPAnswer::notHTTP("Response")));
}

Lines dueUploadWithoutADatabase() {
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

Lines uploadsThatAreDisabled() {
    return bagThatIs(platform::FakeHTTPAnswer::status(200, R"({"disabled":true})"));
}

Lines noUploadAddress() {
    return joined(logging([](LoggerParts&) {}, upload),
                  bagThatIs(platform::FakeHTTPAnswer::status(200, "[]")));
}

/// Datagrams, and whatever else, on an event socket of the real host.
Lines eventsOnTheSocket(const std::vector<std::string>& datagrams, uid_t sender = ::geteuid()) {
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
    return log.lines();
}

Lines malformedEvents() {
    const auto unknown = wire::encodeEvent("unknown", "name").value();
    return eventsOnTheSocket({"", "text", std::string(wire::kEventMaxSize + 1, 'x'),
                              std::string(unknown.begin(), unknown.end())});
}

Lines hostWithoutASocket() {
    const support::RootDirectory root;
    root.makeDirectory("/etc");
    platform::FakeSystemLog log;
    const platform::LinuxHost host({.paths = root.paths(), .log = &log});
    return log.lines();
}

/// No run loop can be made. A limit on the process would be met by the sanitizers, too.
Lines hostWithoutDescriptors() {
    const support::RootDirectory root;
    platform::FakeSystemLog log;
    runLoopError = -EMFILE;
    EXPECT_THROW(platform::LinuxHost({.paths = root.paths(), .log = &log}), std::system_error);
    runLoopError = 0;
    EXPECT_THAT(log.texts(),
                testing::ElementsAre("kstd: cannot start: the run loop: Too many open files."));
    return log.lines();
}

/// The alarm's event without what the alarm's service puts into it.
Lines alarmWithoutADate() {
    const support::RootDirectory root;
    root.makeDirectory("/etc");
    const support::TemporaryDirectory directory;
    const std::string path = directory.file("socket");
    platform::FakeSystemLog log;
    platform::LinuxHost host(
        {.paths = root.paths(), .eventSocket = platform::makeEventSocket(path), .log = &log});
    const base::FileDescriptor sending(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto address = base::UnixAddress::of(path).value();
    const auto event = wire::encodeEvent(wire::kAlarmStream, wire::kAlarmName).value();
    EXPECT_EQ(::sendto(sending.get(), event.data(), event.size(), 0, address.get(), address.size()),
              static_cast<ssize_t>(event.size()));
    EXPECT_TRUE(host.interfaces().runLoop.runOnce({0}));
    return log.lines();
}

Lines socketThatCannotBeReceivedFrom() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(::pipe(ends), 0);
    const base::FileDescriptor writing(ends[1]);
    EXPECT_EQ(::write(ends[1], "x", 1), 1);
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    platform::EventSocket socket(base::FileDescriptor{ends[0]}, loop, log,
                                 [](const wire::EventDatagram&) {});
    EXPECT_TRUE(loop.runOnce({0}));
    return log.lines();
}

Lines settingsThatAreNotUsed() {
    const support::RootDirectory root;
    root.makeDirectory("/etc/kstd");
    platform::FakeSystemLog log;
    platform::LinuxManagedSettings settings(root.paths(), log);
    root.put("/etc/kstd/managed-settings.conf", "restricted-mode-allowed = perhaps\n");
    EXPECT_TRUE(settings.isRestrictedModeAllowed());
    root.put("/etc/kstd/managed-settings.conf", "unknown = 1\n");
    EXPECT_TRUE(settings.isRestrictedModeAllowed());
    return log.lines();
}

Lines settingsThatAreNotWatched() {
    platform::FakeSystemLog log;
    platform::LinuxRunLoop loop(log);
    const platform::SettingsWatch watch("/nowhere/at/all", loop, log, [] {});
    return log.lines();
}

Lines configurationThatIsNotUsed() {
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
    return log.lines();
}

Lines uploadSettingsThatAreInDoubt() {
    platform::FakeSystemLog log;
    platform::FakeConfigurationResource resources;
    platform::FakeUserDefaults defaults;
    for (const char* const link : {"no link", "https://user@x.example/", "http://x.example/"}) {
        defaults.set("com.zerva.keystrand.analytics", "splunk_uploadURL", link);
        AnalyticsConfiguration::read(resources, defaults).report(log);
    }
    return log.lines();
}

Lines alarmThatIsNotKept() {
    platform::FakeSystemLog log;
    platform::AlarmStore store("/proc/nowhere", {"event"}, log);
    EXPECT_FALSE(store.save("stream", "event", {1}));
    store.reportLost("stream", "event");
    return log.lines();
}

/// An alarm whose helper answers so, or is not there.
Lines alarmWith(const std::optional<wire::AlarmAnswer>& answer) {
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
    while (inProcess.holdsProcess() && log.lines().empty() &&
           loop.runOnce(platform::kDistantFuture)) {
    }
    return log.lines();
}

Lines alarmWithoutAHelper() {
    return alarmWith(std::nullopt);
}

Lines alarmThatDoesNotWake() {
    return alarmWith(wire::AlarmAnswer{
        wire::AlarmAnswer::Timer::waits, false, platform::kDistantFuture.nanosecondsSince1970, {}});
}

Lines eventOfAnotherUser() {
    return eventsOnTheSocket({"text"}, 65534);
}
/// A line that must come: its class, and how it begins. An asterisk stands for any text.
struct ClassedLine {
    std::string_view id;
    std::string_view beginning;
};

struct Example {
    const char* name;
    Lines (*lines)();
    /// Every line that is of a class, in its turn. The others are of none.
    std::vector<ClassedLine> classed;
    bool needsRoot = false;
};

const std::vector<Example> kExamples = {
    {"daemonThatStarts",
     daemonThatStarts,
     {{message::kDaemonStarted, "kstd: main: Entering the main runloop."}}},
    {"startWithoutFiles",
     startWithoutFiles,
     {{message::kStateFileNotLoaded, "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: "
                                     "Analytics blob not loaded (length = "},
      {message::kStateFileNotLoaded, "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: "
                                     "State blob not loaded (length = "}}},
    {"saveThatFails",
     saveThatFails,
     {{message::kStateFileNotSaved,
       "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: returning, err = "}}},
    {"kernelThatRefuses",
     kernelThatRefuses,
     {{message::kKernelServiceFailed, "KSTLib: KSTKernelControl: returning, err = "},
      {message::kKernelSideNotTold,
       "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: returning, err = "}}},
    {"kernelThatIsNotThere",
     kernelThatIsNotThere,
     {{message::kKernelServiceFailed, "kstd: AssertMacros: entry "}}},
    {"kernelThatNobodyServes",
     kernelThatNobodyServes,
     {{message::kKernelServiceFailed, "kstd: KernelSocket: cannot connect to "}}},
    {"kernelThatHasNoSuchEntry",
     kernelThatHasNoSuchEntry,
     {{message::kKernelServiceFailed, "kstd: ServiceRegistry: cannot "}}},
    {"startThatIsNotTold",
     startThatIsNotTold,
     {{message::kStateFileNotLoaded, "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: "
                                     "Analytics blob not loaded (length = "},
      {message::kStateFileNotLoaded, "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: "
                                     "State blob not loaded (length = "},
      {message::kKernelServiceFailed, "KSTLib: KSTKernelControl: returning, err = "},
      {message::kKernelSideNotTold,
       "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: returning, err = "}}},
    {"fileThatCannotBeOpened",
     fileThatCannotBeOpened,
     {{message::kStateFileFailed, "kstd: Files: cannot "}}},
    {"eventThatCannotBeStored",
     eventThatCannotBeStored,
     {{message::kEventNotStored, "Couldn't serialize failure record: "}}},
    {"serverThatIsAcceptedByForce",
     serverThatIsAcceptedByForce,
     {{message::kServerChallenge, "Splunk upload challenge"},
      {message::kServerAccepted, "Force Accepting Splunk Credential"}}},
    {"uploadsThatAreDisabled",
     uploadsThatAreDisabled,
     {{message::kServerChallenge, "Splunk upload challenge"},
      {message::kUploadsDisabled, "not returning a splunk URL because uploads are disabled"},
      {message::kServerChallenge, "Splunk upload challenge"}}},
    {"kernelOfAnotherUser",
     kernelOfAnotherUser,
     {{message::kKernelServiceNotTrusted, "kstd: KernelSocket: * is served by user "}},
     true},
    {"databaseThatCannotBeOpened",
     databaseThatCannotBeOpened,
     {{message::kDatabaseFailed, "kstd: Database: "},
      {message::kDatabaseNotOpened, "TQAnalyticsLogger: could not open db at init"},
      {message::kDatabaseNotOpened, "TQAnalyticsLogger: failed to open db"},
      {message::kDatabaseNotOpened, "TQAnalyticsLogger: failed to open db"},
      {message::kDatabaseNotOpened, "TQAnalyticsLogger: failed to open db"}}},
    {"databaseThatCannotBeWritten",
     databaseThatCannotBeWritten,
     {{message::kDatabaseFailed, "KSTDSQLite: Error executing SQL: "},
      {message::kDatabaseFailed, "kstd: Database: "},
      {message::kDatabaseFailed, "Error preparing statement: "},
      {message::kDatabaseFailed, "KSTDSQLite: Failed to step "},
      {message::kDatabaseFailed, "kstd: Database: "}}},
    {"serverThatIsNotTrusted",
     serverThatIsNotTrusted,
     {{message::kServerNotTrusted, "Error in uploading the events to splunk: server not trusted"},
      {message::kServerNotTrusted,
       "Unable to fetch splunk endpoint at URL: * -- error: server not trusted"},
      {message::kServerChallenge, "Splunk upload challenge"}}},
    {"uploadsThatFail",
     uploadsThatFail,
     {{message::kUploadFailed, "Error in uploading the events to splunk: "},
      {message::kServerChallenge, "Splunk upload challenge"},
      {message::kUploadFailed, "Splunk upload unexpected status to URL: "},
      {message::kServerChallenge, "Splunk upload challenge"},
      {message::kUploadFailed, "Received the wrong kind of response: "}}},
    {"dueUploadWithoutADatabase",
     dueUploadWithoutADatabase,
     {{message::kDatabaseFailed, "kstd: Database: "},
      {message::kDatabaseNotOpened, "TQAnalyticsLogger: failed to open db"},
      {message::kDatabaseNotOpened, "can't get logging JSON because database is not openable"},
      {message::kUploadFailed, "TQAnalytics: failed to upload json to analytics server "}}},
    {"noUploadAddress",
     noUploadAddress,
     {{message::kNoUploadAddress, "Unable to fetch splunk endpoint at URL: "},
      {message::kNoUploadAddress, "failed to get a splunk upload endpoint - not uploading"},
      {message::kServerChallenge, "Splunk upload challenge"},
      {message::kNoUploadAddress, "Malformed Ombrix config payload!"},
      {message::kServerChallenge, "Splunk upload challenge"}}},
    {"eventOfAnotherUser",
     eventOfAnotherUser,
     {{message::kForeignEvent, "kstd: EventSocket: dropped datagram of "}},
     true},
    {"malformedEvents",
     malformedEvents,
     {{message::kMalformedEvent, "kstd: EventSocket: dropped malformed datagram, "},
      {message::kMalformedEvent, "kstd: EventSocket: dropped malformed datagram, "},
      {message::kMalformedEvent, "kstd: EventSocket: dropped oversized datagram, "},
      {message::kMalformedEvent, "kstd: EventStream: dropped event "}}},
    {"alarmWithoutADate",
     alarmWithoutADate,
     {{message::kMalformedEvent,
       "kstd: EventSocket: dropped alarm com.zerva.kstd.alarm without a date."}}},
    {"hostWithoutASocket",
     hostWithoutASocket,
     {{message::kNoEventSocket, "kstd: EventSocket: no socket was handed over"}}},
    {"hostWithoutDescriptors",
     hostWithoutDescriptors,
     {{message::kCannotStart, "kstd: cannot start: "}}},
    {"socketThatCannotBeReceivedFrom",
     socketThatCannotBeReceivedFrom,
     {{message::kNoEventSocket, "kstd: EventSocket: cannot receive"}}},
    {"settingsThatAreNotUsed",
     settingsThatAreNotUsed,
     {{message::kSettingsNotUsed, "kstd: ManagedSettings: "},
      {message::kSettingsNotUsed, "kstd: ManagedSettings: "}}},
    {"settingsThatAreNotWatched",
     settingsThatAreNotWatched,
     {{message::kSettingsNotWatched, "kstd: SettingsWatch: cannot watch "}}},
    {"configurationThatIsNotUsed",
     configurationThatIsNotUsed,
     {{message::kConfigurationNotUsed, "kstd: UserDefaults: "},
      {message::kConfigurationNotUsed, "kstd: ConfigurationResource: "}}},
    {"uploadSettingsThatAreInDoubt",
     uploadSettingsThatAreInDoubt,
     {{message::kUploadSettingInDoubt, "kstd: AnalyticsConfiguration: "},
      {message::kUploadSettingInDoubt, "kstd: AnalyticsConfiguration: "},
      {message::kUploadSettingInDoubt, "kstd: AnalyticsConfiguration: "}}},
    {"alarmThatIsNotKept",
     alarmThatIsNotKept,
     {{message::kAlarmNotKept, "kstd: AlarmStore: cannot keep the alarm on disk: "},
      {message::kAlarmNotKept,
       "kstd: AlarmStore: the alarm is lost until the kernel side sends it again: "}}},
    {"alarmWithoutAHelper",
     alarmWithoutAHelper,
     {{message::kAlarmWithoutInitSystem, "kstd: AlarmWaker: no timer of the init system"}}},
    {"alarmThatDoesNotWake",
     alarmThatDoesNotWake,
     {{message::kAlarmDoesNotWake, "kstd: AlarmWaker: this machine cannot be woken from sleep"}}},
};

Lines classedOnly(Lines lines) {
    std::erase_if(lines, [](const auto& line) { return line.messageId.empty(); });
    return lines;
}

bool beginsLike(std::string_view line, std::string_view beginning) {
    const std::size_t star = beginning.find('*');
    if (star == std::string_view::npos) {
        return line.starts_with(beginning);
    }
    return line.starts_with(beginning.substr(0, star)) &&
           line.substr(star).find(beginning.substr(star + 1)) != std::string_view::npos;
}

/// One line each: the class, and the text.
std::string shown(std::string_view id, std::string_view text) {
    return base::concat(id, ' ', text, '\n');
}

/// A line that begins as is wanted in its place is shown as what is wanted.
std::string shown(const Lines& lines, const std::vector<ClassedLine>& wanted) {
    std::string all;
    for (std::size_t i = 0; i < lines.size(); ++i) {
        const bool isWanted = i < wanted.size() && beginsLike(lines[i].text, wanted[i].beginning);
        all += shown(lines[i].messageId,
                     isWanted ? wanted[i].beginning : std::string_view(lines[i].text));
    }
    return all;
}

class MessageClassesTest : public testing::TestWithParam<Example> {};

TEST_P(MessageClassesTest, LinesHaveTheirClasses) {
    const Example& example = GetParam();
    if (example.needsRoot && ::geteuid() != 0) {
        GTEST_SKIP() << "another user's doing needs root";
    }
    std::string wanted;
    for (const auto& [id, beginning] : example.classed) {
        wanted += shown(id, beginning);
    }
    EXPECT_EQ(shown(classedOnly(example.lines()), example.classed), wanted);
}

INSTANTIATE_TEST_SUITE_P(All, MessageClassesTest, testing::ValuesIn(kExamples),
                         [](const auto& example) { return std::string(example.param.name); });

} // namespace
} // namespace kstd
