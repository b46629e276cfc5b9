#include "base/Concat.h"
#include "platform/linux/RemoteHTTPSessions.h"
#include "tests/platform/contract/HTTPSessionContract.h"
#include "tests/support/Collector.h"
#include "tests/support/UnusedPort.h"

#include <string>
#include <vector>

namespace contract {

namespace {

/// The server is a real one, tools/collector, and the HTTPS client is the real program, started for
/// each request.
class RemoteHTTPSessionFixture final : public HTTPSessionFixture {
  public:
    platform::HTTPSessions& sessions() override { return sessions_; }

    std::string link() override { return collector_.link("/2/kst"); }
    std::string deadLink() override {
        return base::concat("https://127.0.0.1:", unused_.number(), '/');
    }

    void answer(int status, const std::string& body) override {
        collector_.control(base::concat("status ", status));
        collector_.control(base::concat("body ", body));
    }

    void setTrusted(bool trusted) override {
        collector_.control(trusted ? "certificate good" : "certificate unknown-issuer");
    }

    void hold() override { collector_.control("hold"); }
    void release() override { collector_.control("release"); }
    void awaitRequests(std::size_t count) override {
        collector_.control(base::concat("await-requests ", count));
    }

    std::vector<Request> requests() override {
        std::vector<Request> requests;
        for (std::size_t i = 1; i <= collector_.requestCount(); ++i) {
            const std::string head = collector_.head(i);
            requests.push_back({head.substr(0, head.find(' ')), collector_.body(i),
                                textBetween(head, "User-Agent: ", "\r\n")});
        }
        return requests;
    }

  private:
    [[nodiscard]] static std::string textBetween(const std::string& text, const std::string& before,
                                                 const std::string& after) {
        const std::size_t begin = text.find(before);
        if (begin == std::string::npos) {
            return {};
        }
        const std::size_t from = begin + before.size();
        return text.substr(from, text.find(after, from) - from);
    }

    support::Collector collector_;
    support::UnusedPort unused_;
    platform::RemoteHTTPSessions sessions_{
        {.program = {KSTD_HTTPS, "--trust-anchors", collector_.authority()}}};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Remote, HTTPSessionContract,
                         (fixtureOf<HTTPSessionFixture, RemoteHTTPSessionFixture>()));

} // namespace contract
