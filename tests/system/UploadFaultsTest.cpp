// Uploads of the real daemon to servers that are not in order, or not there.

#include "base/Concat.h"
#include "base/NotCopied.h"
#include "tests/system/UploadFixture.h"

#include <arpa/inet.h>
#include <fstream>
#include <sys/socket.h>
#include <unistd.h>

namespace system_tests {
namespace {

using base::concat;

constexpr char kFailed[] = "Error in uploading the events to splunk: ";

/// A port of this machine that nobody listens on, and nobody else can take.
class ClosedPort : private base::NotCopied {
  public:
    ClosedPort() : socket_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        address_.sin_family = AF_INET;
        address_.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof address_;
        EXPECT_EQ(::bind(socket_, reinterpret_cast<sockaddr*>(&address_), size), 0);
        EXPECT_EQ(::getsockname(socket_, reinterpret_cast<sockaddr*>(&address_), &size), 0);
    }
    ~ClosedPort() { ::close(socket_); }

    [[nodiscard]] int number() const { return ntohs(address_.sin_port); }

  private:
    int socket_;
    sockaddr_in address_{};
};

/// The most memory that a process has had, in KiB.
long peakMemory(pid_t process) {
    std::ifstream status(concat("/proc/", process, "/status"));
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with("VmHWM:")) {
            return std::stol(line.substr(6));
        }
    }
    ADD_FAILURE() << "no figure";
    return 0;
}

class UploadFaultsTest : public UploadFixture {
  protected:
    /// Under the fault, an event that finds the upload due ends with that reason and is kept.
    void expectFailure(const std::string& fault, const Lines& expected) {
        SCOPED_TRACE(fault);
        control("fault " + fault);
        const int before = storedEvents();
        EXPECT_EQ(withoutReasons(publishWhenDue()), expected);
        EXPECT_EQ(storedEvents(), before + 1);
        EXPECT_EQ(uploadDate(), 978307200);
    }

    /// A server under this fault is too slow.
    void expectToBeGivenUp(const std::string& fault) {
        launchFor({.uploadURL = uploadLink()}, {"--answer-limit", "0.2"});
        expectFailure(fault, {"Splunk upload start", "Splunk upload challenge",
                              concat(kFailed, "timed out")});
        makeUploadDue();
        // The next daemon, with a patience that a busy machine does not exhaust.
        control("reset");
        launch({"--trust-anchors", collector.authority()});
        expectNextUploadIsAccepted();
    }

    /// What is kept is uploaded once the server is in order.
    void expectRecovery() {
        control("reset");
        expectNextUploadIsAccepted();
    }
};

class NoServerTest : public AnalyticsFixture {
  protected:
    void SetUp() override { startKernel(); }

    void expectNoUpload(const UploadSettings& settings, const Lines& expected) {
        configure(settings);
        launch();
        // The first event may be overdue by what a former daemon has left.
        publishEvent();
        const int before = storedEvents();
        makeUploadDue();
        EXPECT_EQ(withoutReasons(publishEvent()), expected);
        EXPECT_EQ(storedEvents(), before + 1);
        // And another one.
        EXPECT_EQ(withoutReasons(publishEvent()), expected);
        EXPECT_EQ(storedEvents(), before + 2);
    }
};

TEST_F(UploadFaultsTest, ConnectionsThatBreak) {
    launchFor({.uploadURL = uploadLink()});
    control("body-size 1000");
    const Lines cannotConnect = {"Splunk upload start", concat(kFailed, "cannot connect")};
    const Lines transferFailed = {"Splunk upload start", "Splunk upload challenge",
                                  concat(kFailed, "transfer failed")};
    expectFailure("reset-on-connect", cannotConnect);
    expectFailure("garbage-instead-of-tls", cannotConnect);
    for (const char* const fault :
         {"reset-in-request", "hang-up", "garbage-instead-of-http", "huge-header-line"}) {
        expectFailure(fault, transferFailed);
    }
    expectRecovery();
}

TEST_F(UploadFaultsTest, AnswersWithoutEndAreNotKept) {
    launchFor({.uploadURL = uploadLink()});
    expectRecovery();
    [[maybe_unused]] const long before = peakMemory(daemon->pid());
    for (const char* const fault : {"huge-headers", "endless-headers", "endless-interim"}) {
        expectFailure(fault, {"Splunk upload start", "Splunk upload challenge",
                              concat(kFailed, "headers longer than 65536 bytes")});
    }
#ifndef KSTD_SANITIZED
    // A sanitizer keeps freed memory for a while on purpose.
    EXPECT_LE(peakMemory(daemon->pid()), before + 4096);
#endif
    expectRecovery();
}

TEST_F(UploadFaultsTest, AcceptedIsWhatTheHeaderOfTheAnswerAccepts) {
    launchFor({.uploadURL = uploadLink()});
    control("body-size 1000");
    for (const char* const fault :
         {"endless-body", "reset-in-response", "hang-up-in-response", "byte-a-second-body"}) {
        SCOPED_TRACE(fault);
        control(concat("fault ", fault));
        expectNextUploadIsAccepted();
    }
    control("fault none");
    control("body-size 2000000");
    expectNextUploadIsAccepted();
}

TEST_F(UploadFaultsTest, ServerThatNeverAnswers) {
    expectToBeGivenUp("never-answers");
}

TEST_F(UploadFaultsTest, ServerThatSendsAByteASecond) {
    expectToBeGivenUp("byte-a-second");
}

TEST_F(UploadFaultsTest, AnUploadOfADaemonThatIsAskedToEndEndsAtOnce) {
    launchFor({.uploadURL = uploadLink()});
    control("fault never-answers");
    makeUploadDue();
    kernel("publish timer-restarted-analytics total=60");
    ASSERT_TRUE(daemon->awaitLine("Splunk upload challenge"));
    daemon->signal(SIGTERM);
    EXPECT_EQ(daemon->awaitEnd(), 0);
    EXPECT_EQ(daemon->count(concat(kFailed, "transfer failed: the daemon is asked to end")), 1U);
    EXPECT_EQ(kernelStatus("acks"), "2");
    EXPECT_EQ(storedEvents(), 2);
    control("reset");
    launch({"--trust-anchors", collector.authority()});
    expectNextUploadIsAccepted();
}

TEST_F(UploadFaultsTest, CertificatesThatAreNotInOrder) {
    const struct {
        const char* name;
        const char* finding;
    } kCertificates[] = {
        {"expired", "certificate has expired"},
        {"self-signed", "self-signed certificate"},
        {"wrong-name", "IP address mismatch"},
        {"unknown-issuer", "unable to get local issuer certificate"},
    };
    launchFor({.uploadURL = uploadLink()});
    for (const auto& [name, finding] : kCertificates) {
        control(concat("certificate ", name));
        expectFailure("none", {"Splunk upload start", "Splunk upload challenge",
                               concat(kFailed, "server not trusted: ", finding)});
    }
    EXPECT_EQ(collector.requestCount(), 0U);
    expectRecovery();

    launchFor({.uploadURL = uploadLink(), .allowInsecureCertificate = true});
    for (const auto& [name, finding] : kCertificates) {
        SCOPED_TRACE(name);
        control(concat("certificate ", name));
        const Lines lines = publishWhenDue();
        Lines expected = acceptedLines();
        expected.insert(expected.begin() + 2, "Force Accepting Splunk Credential");
        EXPECT_EQ(lines, expected);
        EXPECT_EQ(storedEvents(), 0);
    }
    launchFor({.bagURL = bagLink(), .allowInsecureCertificate = true});
    const Lines lines = publishWhenDue();
    EXPECT_EQ(lines,
              (Lines{"Splunk upload challenge", "Force Accepting Splunk Credential",
                     "Malformed Ombrix config payload!",
                     "failed to get a splunk upload endpoint - using bag URL instead",
                     "Splunk upload start", "Splunk upload challenge",
                     "Force Accepting Splunk Credential", "Splunk upload success",
                     "uploading oracle statistics: " + collector.body(collector.requestCount()),
                     "uploaded oracle statistics"}));
}

TEST_F(NoServerTest, NothingIsUploadedWithoutAnAddress) {
    expectNoUpload({}, {"Unable to fetch splunk endpoint at URL: (null) -- error: unsupported URL",
                        "failed to get a splunk upload endpoint - using bag URL instead",
                        "failed to get a splunk upload endpoint - not uploading"});
}

TEST_F(NoServerTest, NothingIsUploadedToAFile) {
    const std::string target = "file://" + real("/var/root/document");
    expectNoUpload({.uploadURL = target},
                   {"Splunk upload start", concat(kFailed, "unsupported URL")});
    EXPECT_FALSE(file("/var/root/document"));
}

TEST_F(NoServerTest, PortThatNobodyListensOn) {
    const ClosedPort port;
    const std::string link = concat("https://127.0.0.1:", port.number(), "/2/kst");
    expectNoUpload({.uploadURL = link}, {"Splunk upload start", concat(kFailed, "cannot connect")});
}

} // namespace
} // namespace system_tests
