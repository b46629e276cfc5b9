#pragma once

#include "platform/HTTPSession.h"
#include "platform/https/HTTPAnswer.h"
#include "platform/https/HTTPCaller.h"
#include "platform/https/LinuxHTTPSessions.h"
#include "platform/https/TrustCheck.h"

#include <array>
#include <chrono>
#include <cstdint>
#include <curl/curl.h>
#include <map>
#include <memory>
#include <optional>
#include <string>

namespace platform {

/// What all requests of a session share.
struct HTTPTransferSettings {
    std::map<std::string, std::string> headers = {};
    std::weak_ptr<HTTPSessionDelegate> delegate = {};
    LinuxHTTPOptions options;
};

/// One request over a connection of its own. The request must have passed refusalOf. With a caller
/// the body is what that gives, and the request's own does not count. All of them must outlast
/// this.
class HTTPTransfer {
  public:
    HTTPTransfer(const HTTPRequest& request, const HTTPTransferSettings& settings,
                 HTTPCaller* caller = nullptr);
    HTTPTransfer(const HTTPTransfer&) = delete;
    HTTPTransfer& operator=(const HTTPTransfer&) = delete;
    ~HTTPTransfer() = default;

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
    [[nodiscard]] std::uint64_t bodySize() const;
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
    HTTPCaller* caller_;
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
