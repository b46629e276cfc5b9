#pragma once

#include "base/NotCopied.h"
#include "platform/HTTPSession.h"
#include "tests/platform/contract/ContractTest.h"

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace contract {

/// A server that answers "200" without a body, and sessions that reach it.
struct HTTPSessionFixture : private base::NotCopied {
    virtual ~HTTPSessionFixture() = default;

    virtual platform::HTTPSessions& sessions() = 0;

    /// A link of "https" to the server.
    virtual std::string link() = 0;
    /// One to a place where nobody listens.
    virtual std::string deadLink() = 0;

    virtual void answer(int status, const std::string& body) = 0;
    /// Whether the server has a certificate that this machine trusts; it has at first.
    virtual void setTrusted(bool trusted) = 0;

    /// The server keeps its answers back.
    virtual void hold() = 0;
    virtual void release() = 0;
    /// Waits until the server was asked this often.
    virtual void awaitRequests(std::size_t count) = 0;

    struct Request {
        std::string method;
        std::string body;
        std::string userAgent;

        friend bool operator==(const Request&, const Request&) = default;
    };
    /// What the server was asked.
    virtual std::vector<Request> requests() = 0;
};

class HTTPSessionContract : public ContractTest<HTTPSessionFixture> {
  protected:
    /// How a GET of the server's link ends.
    [[nodiscard]] std::string
    outcome(const std::shared_ptr<platform::HTTPSessionDelegate>& delegate);

    /// How it ends with a trusted server and with one that is not.
    [[nodiscard]] std::vector<std::string>
    outcomes(const std::shared_ptr<platform::HTTPSessionDelegate>& delegate);
};

} // namespace contract
