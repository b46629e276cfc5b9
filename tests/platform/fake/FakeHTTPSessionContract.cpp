#include "platform/fake/FakeHTTPSessions.h"
#include "tests/platform/contract/HTTPSessionContract.h"

namespace contract {

namespace {

constexpr char kLink[] = "https://collector.example/2/kst";

std::string userAgentOf(const platform::FakeHTTPRequest& request) {
    const auto header = request.headers.find("User-Agent");
    return header != request.headers.end() ? header->second : std::string();
}

class FakeHTTPSessionFixture final : public HTTPSessionFixture {
  public:
    FakeHTTPSessionFixture() { set(); }

    platform::HTTPSessions& sessions() override { return sessions_; }
    std::string link() override { return kLink; }
    std::string deadLink() override { return "https://nobody.example/"; }

    void answer(int status, const std::string& body) override {
        answer_.reply = platform::FakeHTTPAnswer::status(status, body).reply;
        set();
    }

    void setTrusted(bool trusted) override {
        answer_.challenge->trust = trusted ? platform::TrustResult::unspecified
                                           : platform::TrustResult::recoverableFailure;
        set();
    }

    void hold() override {
        answer_.held = true;
        set();
    }

    void release() override { sessions_.release(); }
    void awaitRequests(std::size_t count) override { sessions_.awaitRequests(count); }

    std::vector<Request> requests() override {
        std::vector<Request> requests;
        for (const platform::FakeHTTPRequest& request : sessions_.requests()) {
            if (request.arrived) {
                requests.push_back({request.method, request.body, userAgentOf(request)});
            }
        }
        return requests;
    }

  private:
    void set() {
        sessions_.setAnswer("GET", kLink, answer_);
        sessions_.setAnswer("POST", kLink, answer_);
    }

    platform::FakeHTTPAnswer answer_ = platform::FakeHTTPAnswer::status(200);
    platform::FakeHTTPSessions sessions_;
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, HTTPSessionContract,
                         (fixtureOf<HTTPSessionFixture, FakeHTTPSessionFixture>()));

} // namespace contract
