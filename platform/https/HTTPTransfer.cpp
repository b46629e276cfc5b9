#include "platform/https/HTTPTransfer.h"

#include "base/Concat.h"
#include "platform/shared/HTTPRequestCheck.h"

#include <algorithm>
#include <iterator>
#include <mutex>
#include <sys/socket.h>
#include <utility>

namespace platform {

namespace {

/// Headers that libcurl would add by itself.
constexpr const char* kUnwantedHeaders[] = {"Accept:", "Content-Type:", "Expect:"};

void initialiseLibrary() {
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
}

HTTPAnswer& answerAt(void* answer) {
    return *static_cast<HTTPAnswer*>(answer);
}

HTTPCaller& callerAt(void* caller) {
    return *static_cast<HTTPCaller*>(caller);
}

extern "C" {

// Anything but the size that came ends the transfer.
std::size_t receiveBody(char* bytes, std::size_t one, std::size_t count, void* answer) noexcept {
    return answerAt(answer).takeBody(bytes, one * count) ? one * count : CURL_WRITEFUNC_ERROR;
}

std::size_t receiveHeader(char* /*bytes*/, std::size_t one, std::size_t count,
                          void* answer) noexcept {
    return answerAt(answer).countHeaders(one * count) ? one * count : CURL_WRITEFUNC_ERROR;
}

std::size_t giveBody(char* room, std::size_t one, std::size_t count, void* caller) noexcept {
    const std::size_t given = callerAt(caller).giveBody({room, one * count});
    return given > 0 ? given : CURL_READFUNC_ABORT;
}

// Anything but 0 ends the transfer.
int goOn(void* caller, curl_off_t /*down*/, curl_off_t /*downloaded*/, curl_off_t /*up*/,
         curl_off_t /*uploaded*/) noexcept {
    return callerAt(caller).isWaiting() ? 0 : 1;
}

CURLcode installTrustCheck(CURL* /*handle*/, void* context, void* check) noexcept {
    return static_cast<TrustCheck*>(check)->install(static_cast<SSL_CTX*>(context))
               ? CURLE_OK
               : CURLE_SSL_CERTPROBLEM;
}

curl_socket_t openSocket(void* /*unused*/, curlsocktype /*purpose*/,
                         curl_sockaddr* address) noexcept {
    return ::socket(address->family, address->socktype | SOCK_CLOEXEC, address->protocol);
}

} // extern "C"

std::string headerLine(const std::string& name, const std::string& value) {
    return value.empty() ? base::concat(name, ';') : base::concat(name, ": ", value);
}

std::string withoutBrackets(std::string host) {
    return host.size() > 2 && host.front() == '[' ? host.substr(1, host.size() - 2) : host;
}

/// The code and the words for a transfer that failed by itself.
struct Failure {
    std::int64_t code;
    std::string_view text;
};

Failure failureFor(CURLcode code) {
    switch (code) {
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_CONNECT:
    case CURLE_SSL_CONNECT_ERROR:
        return {kCannotConnect, "cannot connect"};
    case CURLE_OPERATION_TIMEDOUT:
        return {kTimedOut, "timed out"};
    case CURLE_PEER_FAILED_VERIFICATION:
        return {kTrustRefused, "server not trusted"};
    default:
        return {kTransferFailed, "transfer failed"};
    }
}

} // namespace

HTTPTransfer::HTTPTransfer(const HTTPRequest& request, const HTTPTransferSettings& settings,
                           HTTPCaller* caller)
    : request_(request),
      settings_(settings),
      caller_(caller),
      answer_(request.maximumAnswerSize, kMaximumAnswerHeaders) {
    initialiseLibrary();
    url_.reset(curl_url());
    handle_.reset(curl_easy_init());
}

HTTPReply HTTPTransfer::perform() {
    std::optional<std::string> host = readLink();
    if (!host) {
        return failedReply(kUnsupportedLink, "unsupported URL");
    }
    trust_.emplace(*std::move(host), settings_.options.trustAnchors, settings_.delegate);
    if (!handle_ || !makeHeaders() || !configure()) {
        return failedReply(kTransferFailed, "transfer failed: cannot be prepared");
    }
    return replyFor(curl_easy_perform(handle_.get()));
}

std::optional<std::string> HTTPTransfer::readLink() {
    if (!url_ || curl_url_set(url_.get(), CURLUPART_URL, request_.link->text.c_str(), 0) != 0) {
        return std::nullopt;
    }
    curl_url_set(url_.get(), CURLUPART_USER, nullptr, 0);
    curl_url_set(url_.get(), CURLUPART_PASSWORD, nullptr, 0);
    char* host = nullptr;
    if (curl_url_get(url_.get(), CURLUPART_HOST, &host, 0) != 0) {
        return std::nullopt;
    }
    std::string text = withoutBrackets(host);
    curl_free(host);
    return text;
}

template <typename Value>
void HTTPTransfer::set(CURLoption option, Value value) {
    if (configured_ == CURLE_OK) {
        configured_ = curl_easy_setopt(handle_.get(), option, value);
    }
}

bool HTTPTransfer::configure() {
    configureProtocol();
    configureRequest();
    configureAnswer();
    configureTrust();
    configureLimits();
    configureCaller();
    return configured_ == CURLE_OK;
}

void HTTPTransfer::configureProtocol() {
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_HTTP_VERSION, long{CURL_HTTP_VERSION_1_1});
    set(CURLOPT_FOLLOWLOCATION, 0L);
    set(CURLOPT_PROXY, "");
    set(CURLOPT_FORBID_REUSE, 1L);
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_OPENSOCKETFUNCTION, openSocket);
    set(CURLOPT_ERRORBUFFER, message_.data());
}

void HTTPTransfer::configureRequest() {
    set(CURLOPT_CURLU, url_.get());
    set(CURLOPT_HTTPHEADER, headers_.get());
    if (request_.method == "POST") {
        set(CURLOPT_POST, 1L);
        configureBody();
    } else {
        set(CURLOPT_HTTPGET, 1L);
    }
}

void HTTPTransfer::configureBody() {
    const std::uint64_t size = caller_ != nullptr ? caller_->bodySize() : request_.body.size();
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(size));
    if (caller_ != nullptr && size > 0) {
        set(CURLOPT_READFUNCTION, giveBody);
        set(CURLOPT_READDATA, caller_);
    } else {
        // Without a buffer libcurl would ask a callback for the body.
        set(CURLOPT_POSTFIELDS, size == 0 ? "" : request_.body.data());
    }
}

void HTTPTransfer::configureCaller() {
    if (caller_ == nullptr) {
        return;
    }
    set(CURLOPT_NOPROGRESS, 0L);
    set(CURLOPT_XFERINFOFUNCTION, goOn);
    set(CURLOPT_XFERINFODATA, caller_);
    // The look-up of a host's name that nobody waits for any more is left alone.
    set(CURLOPT_QUICK_EXIT, 1L);
}

void HTTPTransfer::configureAnswer() {
    set(CURLOPT_WRITEFUNCTION, receiveBody);
    set(CURLOPT_WRITEDATA, &answer_);
    set(CURLOPT_HEADERFUNCTION, receiveHeader);
    set(CURLOPT_HEADERDATA, &answer_);
}

void HTTPTransfer::configureTrust() {
    set(CURLOPT_SSLVERSION, long{CURL_SSLVERSION_TLSv1_2});
    // Without it libcurl does not heed what the check says. The host's name is part of that check.
    set(CURLOPT_SSL_VERIFYPEER, 1L);
    set(CURLOPT_SSL_VERIFYHOST, 0L);
    set<const char*>(CURLOPT_CAINFO, nullptr);
    set<const char*>(CURLOPT_CAPATH, nullptr);
    // A resumed connection would not be checked.
    set(CURLOPT_SSL_SESSIONID_CACHE, 0L);
    set(CURLOPT_SSL_CTX_FUNCTION, installTrustCheck);
    set(CURLOPT_SSL_CTX_DATA, &*trust_);
}

void HTTPTransfer::configureLimits() {
    const LinuxHTTPOptions& options = settings_.options;
    set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(options.connectLimit.count()));
    set(CURLOPT_LOW_SPEED_LIMIT, options.slowestSpeed);
    set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(options.slowLimit.count()));
}

bool HTTPTransfer::addHeader(const std::string& line) {
    curl_slist* longer = curl_slist_append(headers_.get(), line.c_str());
    if (longer == nullptr) {
        return false;
    }
    static_cast<void>(headers_.release());
    headers_.reset(longer);
    return true;
}

bool HTTPTransfer::makeHeaders() {
    return std::all_of(std::begin(kUnwantedHeaders), std::end(kUnwantedHeaders),
                       [this](const char* unwanted) { return addHeader(unwanted); }) &&
           std::all_of(settings_.headers.begin(), settings_.headers.end(),
                       [this](const auto& header) {
                           return addHeader(headerLine(header.first, header.second));
                       });
}

HTTPReply HTTPTransfer::replyFor(CURLcode code) {
    if (answer_.excess()) {
        return failedReply(kAnswerTooLarge, *answer_.excess());
    }
    if (trust_->refusal()) {
        return failedReply(kTrustRefused, base::concat("server not trusted: ", *trust_->refusal()));
    }
    const bool endedWithInterimAnswer = code == CURLE_GOT_NOTHING && status() != 0;
    if (code == CURLE_OK || endedWithInterimAnswer) {
        return response();
    }
    const Failure failure = failureFor(code);
    return failedReply(failure.code, base::concat(failure.text, ": ", reasonFor(code)));
}

HTTPReply HTTPTransfer::response() {
    return {std::nullopt, HTTPResponse{static_cast<int>(status()), "HTTPResponse"},
            answer_.takeWhole()};
}

long HTTPTransfer::status() const {
    long status = 0;
    curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &status);
    return status;
}

std::string HTTPTransfer::reasonFor(CURLcode code) const {
    return message_[0] != '\0' ? message_.data() : curl_easy_strerror(code);
}

} // namespace platform
