#pragma once

#include "base/NotCopied.h"
#include "platform/HTTPSession.h"
#include "platform/host/HTTPRequests.h"
#include "platform/https/HTTPAnswer.h"
#include "platform/https/TrustCheck.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <curl/curl.h>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>

namespace platform {

/// Longer headers of an answer, all of them together with those of interim answers, end a request
/// with kAnswerTooLarge. (One header of more than 100 KB fails in libcurl: kTransferFailed.)
inline constexpr std::size_t kMaximumAnswerHeaders = 64UL * 1024;

/// How a program wants its HTTPS client to be.
struct HTTPOptions {
    /// Certificates of the authorities that this machine trusts: a file of them (PEM), or a
    /// directory with one file for each under OpenSSL's hashed names. Read anew for every
    /// connection. When it cannot be read, no server is trusted by evaluation.
    std::string trustAnchors = "/etc/ssl/certs/ca-certificates.crt";
    HTTPLimits limits = {};
};

/// Who waits for the end of a transfer, and gives the body of its request piece by piece. Called on
/// the thread that makes the transfer, while it does.
class HTTPCaller : private base::NotCopied {
  public:
    virtual ~HTTPCaller() = default;

    [[nodiscard]] virtual std::uint64_t bodySize() const = 0;

    /// Fills the beginning of `room` with what comes next of the body and says how much that is.
    /// 0, when there is no more to be had, ends the transfer.
    [[nodiscard]] virtual std::size_t giveBody(std::span<char> room) = 0;

    /// Whether the transfer is to go on. Asked about once a second or more often.
    [[nodiscard]] virtual bool isWaiting() = 0;
};

/// What a request has from its session.
struct HTTPTransferSettings {
    std::map<std::string, std::string> headers = {};
    std::weak_ptr<HTTPSessionDelegate> delegate = {};
    HTTPOptions options;
};

/// One request of HTTP or HTTPS over libcurl and OpenSSL: HTTP/1.1, TLS 1.2 or newer, a connection
/// of its own. The request must have passed refusalOf. The body is what the caller gives; the
/// request's own does not count. All of them must outlast this.
///
/// Nothing that the environment says about proxies or certificates is obeyed.
///
/// A server is trusted when its certificate leads to a trust anchor, is valid now, is for servers,
/// and names the link's host among its alternative names; its common name does not count. The
/// evaluation of any other is recoverableFailure. Challenges have no other method than
/// kServerTrustMethod, once for each connection with TLS.
///
/// A server that hangs up after an interim answer (a status below 200) has answered with it.
/// A user and a password in a link are not sent.
class HTTPTransfer : private base::NotCopied {
  public:
    HTTPTransfer(const HTTPRequest& request, const HTTPTransferSettings& settings,
                 HTTPCaller& caller);

    /// Makes the request and waits for its end. Once.
    [[nodiscard]] HTTPReply perform();

  private:
    using Clock = std::chrono::steady_clock;

    /// What the server is waited for.
    struct Stage {
        enum class Kind { connecting, fetching, sending, answering } kind;
        HTTPLimits::Time limit;
        Clock::time_point end;
    };

    struct Freed {
        void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
        void operator()(CURLU* url) const { curl_url_cleanup(url); }
        void operator()(curl_slist* list) const { curl_slist_free_all(list); }
    };

    /// The link's host as the connection is made to; none when the link cannot be understood.
    [[nodiscard]] std::optional<std::string> readLink();

    [[nodiscard]] bool configure();
    void configureProtocol();
    void configureRequest();
    void configureBody();
    void configureAnswer();
    void configureTrust();
    [[nodiscard]] bool addHeader(const std::string& line);
    [[nodiscard]] bool makeHeaders();

    template <typename Value>
    void set(CURLoption option, Value value);

    /// Makes the transfer, to its end or until it may end.
    [[nodiscard]] CURLcode transfer();
    [[nodiscard]] CURLcode transferWith(CURLM* transfers);

    [[nodiscard]] bool isPost() const { return request_.method == "POST"; }
    void enter(Stage::Kind kind);
    [[nodiscard]] static const char* wordsFor(Stage::Kind kind);
    void noteProgress();
    [[nodiscard]] bool isConnected() const;
    /// Whether the server has got all of a document.
    [[nodiscard]] bool isSent() const;
    /// Whether what has come of the answer to a document decides about it.
    [[nodiscard]] bool isDecided() const;

    [[nodiscard]] HTTPReply replyFor(CURLcode code);
    [[nodiscard]] HTTPReply response();
    [[nodiscard]] long status() const;
    [[nodiscard]] std::string reasonFor(CURLcode code) const;

    const HTTPRequest& request_;
    const HTTPTransferSettings& settings_;
    HTTPCaller& caller_;
    HTTPAnswer answer_;
    std::optional<TrustCheck> trust_;
    std::array<char, CURL_ERROR_SIZE> message_{};
    std::unique_ptr<CURLU, Freed> url_;
    std::unique_ptr<curl_slist, Freed> headers_;
    CURLcode configured_ = CURLE_OK;
    Stage stage_{};
    bool hasStageEnded_ = false;
    /// Last, because its connection uses the rest until it is closed.
    std::unique_ptr<CURL, Freed> handle_;
};

} // namespace platform
