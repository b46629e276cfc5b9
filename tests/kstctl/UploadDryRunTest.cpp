// The document that `kstctl upload --dry-run` prints, and the one that a server is sent.

#include "base/Concat.h"
#include "tests/kstctl/KstctlFixture.h"
#include "tests/support/Collector.h"

#include <fstream>

namespace kstctl {
namespace {

using platform::Value;

class UploadDryRunTest : public KstctlFixture {
  protected:
    /// What stands behind "postTime": in a document, which is its last key.
    static std::string postTimeOf(const std::string& document) {
        const std::size_t start = document.rfind(':') + 1;
        return document.substr(start, document.size() - 1 - start);
    }
};

TEST_F(UploadDryRunTest, DocumentIsTheOneThatTheServerIsSent) {
    support::Collector collector;
    startKernel();
    std::ofstream(real("/etc/os-release")) << "NAME=\"Probe OS\"\nBUILD_ID=77\n";
    configure({.uploadURL = collector.link("/2/kst")});
    launch({"--trust-anchors", collector.authority()});
    publishPolicyEvent();
    // A row without an event is in neither.
    OtherConnection(database()).run("insert into all_events (data) values (x'00')");
    // What is refused stays stored, together with the event that has made it due.
    static_cast<void>(collector.control("status 503"));
    makeUploadDue();
    publishEvent();
    const std::string sent = collector.body(1);
    ASSERT_NE(sent.find("\"build\":\"77\""), std::string::npos);
    ASSERT_NE(sent.find("\"topic\":\"kst\""), std::string::npos);

    const auto before = files();
    const Ran ran = kstctl({"upload", "--dry-run", "--post-time", postTimeOf(sent)});
    EXPECT_EQ(ran.status, 0);
    EXPECT_EQ(ran.out, sent);
    const Value value = json({"upload", "--dry-run", "--post-time", postTimeOf(sent)});
    EXPECT_EQ(at(value, "document"), Value(sent));
    EXPECT_EQ(at(value, "events"), Value(std::int64_t{3}));
    EXPECT_EQ(at(value, "address"), Value(collector.link("/2/kst")));
    EXPECT_EQ(at(value, "isBagAddress"), Value(false));
    EXPECT_EQ(files(), before);
    EXPECT_EQ(collector.requestCount(), 1U);

    // Of this moment it is another one, of the same form.
    const std::string now = kstctl({"upload", "--dry-run"}).out;
    EXPECT_NE(now, sent);
    EXPECT_GT(std::stod(postTimeOf(now)), std::stod(postTimeOf(sent)));
}

TEST_F(UploadDryRunTest, WithoutAnAddressItIsPrintedAllTheSame) {
    startKernel();
    launch();
    publishEvent();
    const Value none = json({"upload", "--dry-run", "--post-time", "1700000000500.25"});
    EXPECT_EQ(at(none, "address"), Value(platform::Null()));
    const std::string text = *at(none, "document").as<std::string>();
    EXPECT_TRUE(text.ends_with(R"({"eventTime":1700000000500.25,"eventType":)"
                               R"("accumulatedPolicyStats","topic":null}],)"
                               R"("postTime":1700000000500.25})"))
        << text;
    configure({.bagURL = "https://x.example/bag"});
    const Value bag = json({"upload", "--dry-run"});
    EXPECT_EQ(at(bag, "address"), Value("https://x.example/bag"));
    EXPECT_EQ(at(bag, "isBagAddress"), Value(true));
    const std::string file = real("/etc/kstd/com.zerva.keystrand.analytics.plist");
    std::ofstream(file) << "nonsense";
    expectFailure({"upload", "--dry-run"}, 5,
                  base::concat("kstd: UserDefaults: ", file, ": not a property list; ignored."));
    const Ran terminal = kstctl({"upload", "--dry-run"}, {.onTerminal = true});
    EXPECT_TRUE(terminal.out.ends_with("}\r\n"));
}

TEST_F(UploadDryRunTest, DaemonIsNotDisturbed) {
    startKernel();
    configure({});
    launch();
    publishEvent();
    constexpr int kEvents = 12;
    for (int count = 1; count <= kEvents; ++count) {
        // Read while the daemon is at it.
        kernel("post com.zerva.Keystrand.KSTRMTimerRestartedAnalyticsCollected");
        const Ran ran = kstctl({"events", "list", "--json"});
        EXPECT_EQ(ran.status, 0);
        EXPECT_EQ(publishEvent(), system_tests::Lines());
        EXPECT_EQ(at(json({"status"}), "database.isPresent"), Value(true));
    }
    EXPECT_GE(storedEvents(), kEvents);
    const std::string last = kstctl({"upload", "--dry-run"}).out;
    EXPECT_FALSE(last.empty());
}

TEST_F(UploadDryRunTest, NothingIsLeftBehindWhenTheDaemonHasEnded) {
    startKernel();
    configure({});
    launch();
    publishEvent();
    EXPECT_EQ(kstctl({"events", "list"}).status, 0);
    daemon->signal(SIGTERM);
    EXPECT_EQ(daemon->awaitEnd(), 0) << testing::PrintToString(daemon->lines());
    const auto before = files();
    EXPECT_FALSE(before.contains(database() + "-wal")) << testing::PrintToString(daemon->lines());
    EXPECT_EQ(at(json({"events", "list"}), "stored"), Value(std::int64_t{1}));
    EXPECT_EQ(at(json({"status"}, 3), "database.events"), Value(std::int64_t{1}));
    kstctl({"upload", "--dry-run"});
    EXPECT_EQ(files(), before);
}

} // namespace
} // namespace kstctl
