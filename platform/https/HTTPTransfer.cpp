#include "platform/https/HTTPTransfer.h"

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"

#include <algorithm>
#include <iterator>
#include <linux/sockios.h>
#include <mutex>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <utility>

namespace platform {

namespace {

/// How often the caller is asked whether it still waits.
constexpr std::chrono::milliseconds kTurn{500};

/// Headers that libcurl would add by itself.
constexpr const char* kUnwantedHeaders[] = {"Accept:", "Content-Type:", "Expect:"};

void initialiseLibrary() {
    // Two threads must not do it at once.
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

// Called with whole lines.
std::size_t receiveHeader(char* bytes, std::size_t one, std::size_t count, void* answer) noexcept {
    return answerAt(answer).countHeader({bytes, one * count}) ? one * count : CURL_WRITEFUNC_ERROR;
}

std::size_t giveBody(char* room, std::size_t one, std::size_t count, void* caller) noexcept {
    const std::size_t given = callerAt(caller).giveBody({room, one * count});
    return given > 0 ? given : CURL_READFUNC_ABORT;
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
    // After a colon without a value the library would leave the header out.
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

const char* HTTPTransfer::wordsFor(Stage::Kind kind) {
    switch (kind) {
    case Stage::Kind::connecting:
        return "not connected";
    case Stage::Kind::fetching:
        return "not fetched";
    case Stage::Kind::sending:
        return "not sent";
    case Stage::Kind::answering:
        break;
    }
    return "no answer";
}

HTTPTransfer::HTTPTransfer(const HTTPRequest& request, const HTTPTransferSettings& settings,
                           HTTPCaller& caller)
    : request_(request),
      settings_(settings),
      caller_(caller),
      answer_(isPost() ? std::nullopt : std::optional(request.maximumAnswerSize),
              kMaximumAnswerHeaders) {
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
    return replyFor(transfer());
}

CURLcode HTTPTransfer::transfer() {
    const std::unique_ptr<CURLM, decltype(&curl_multi_cleanup)> transfers(curl_multi_init(),
                                                                          &curl_multi_cleanup);
    if (!transfers || curl_multi_add_handle(transfers.get(), handle_.get()) != CURLM_OK) {
        return CURLE_FAILED_INIT;
    }
    enter(isPost() ? Stage::Kind::connecting : Stage::Kind::fetching);
    const CURLcode code = transferWith(transfers.get());
    curl_multi_remove_handle(transfers.get(), handle_.get());
    return code;
}

CURLcode HTTPTransfer::transferWith(CURLM* transfers) {
    for (;;) {
        int running = 0;
        if (curl_multi_perform(transfers, &running) != CURLM_OK) {
            return CURLE_FAILED_INIT;
        }
        if (running == 0) {
            int left = 0;
            const CURLMsg* const message = curl_multi_info_read(transfers, &left);
            return message != nullptr ? message->data.result : CURLE_FAILED_INIT;
        }
        if (isDecided()) {
            return CURLE_OK;
        }
        if (!caller_.isWaiting()) {
            return CURLE_ABORTED_BY_CALLBACK;
        }
        noteProgress();
        const auto left = std::chrono::ceil<HTTPLimits::Time>(stage_.end - Clock::now());
        if (left.count() <= 0) {
            hasStageEnded_ = true;
            return CURLE_OPERATION_TIMEDOUT;
        }
        curl_multi_poll(transfers, nullptr, 0, static_cast<int>(std::min(left, kTurn).count()),
                        nullptr);
    }
}

void HTTPTransfer::enter(Stage::Kind kind) {
    const HTTPLimits& limits = settings_.options.limits;
    const HTTPLimits::Time kLimits[] = {limits.connecting, limits.fetching,
                                        limits.toSend(caller_.bodySize()), limits.answering};
    const HTTPLimits::Time limit = kLimits[static_cast<std::size_t>(kind)];
    stage_ = {kind, limit, Clock::now() + limit};
}

void HTTPTransfer::noteProgress() {
    if (stage_.kind == Stage::Kind::connecting && isConnected()) {
        enter(Stage::Kind::sending);
    }
    if (stage_.kind == Stage::Kind::sending && isSent()) {
        enter(Stage::Kind::answering);
    }
}

bool HTTPTransfer::isConnected() const {
    curl_off_t when = 0;
    return curl_easy_getinfo(handle_.get(), CURLINFO_PRETRANSFER_TIME_T, &when) == CURLE_OK &&
           when > 0;
}

bool HTTPTransfer::isSent() const {
    curl_off_t given = 0;
    const auto size = static_cast<curl_off_t>(caller_.bodySize());
    if (curl_easy_getinfo(handle_.get(), CURLINFO_SIZE_UPLOAD_T, &given) != CURLE_OK ||
        given < size) {
        return false;
    }
    // What the system holds back for a slow server has not gone out.
    curl_socket_t socket = CURL_SOCKET_BAD;
    int held = 0;
    return curl_easy_getinfo(handle_.get(), CURLINFO_ACTIVESOCKET, &socket) != CURLE_OK ||
           socket == CURL_SOCKET_BAD || ::ioctl(socket, SIOCOUTQ, &held) != 0 || held == 0;
}

bool HTTPTransfer::isDecided() const {
    const long said = status();
    // A server that refuses a document need not read the rest of it. One that accepts must.
    return isPost() && answer_.isHeaderWhole() && said >= 200 && (said > 299 || isSent());
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
    return configured_ == CURLE_OK;
}

void HTTPTransfer::configureProtocol() {
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_HTTP_VERSION, long{CURL_HTTP_VERSION_1_1});
    set(CURLOPT_FOLLOWLOCATION, 0L);
    set(CURLOPT_PROXY, "");
    set(CURLOPT_FORBID_REUSE, 1L);
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_CONNECTTIMEOUT_MS, static_cast<long>(settings_.options.limits.connecting.count()));
    // The look-up of a host's name that nobody waits for any more is left alone.
    set(CURLOPT_QUICK_EXIT, 1L);
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
    const std::uint64_t size = caller_.bodySize();
    set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(size));
    if (size > 0) {
        set(CURLOPT_READFUNCTION, giveBody);
        set(CURLOPT_READDATA, &caller_);
    } else {
        // Without a buffer libcurl would ask a callback for the body.
        set(CURLOPT_POSTFIELDS, "");
    }
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

bool HTTPTransfer::addHeader(const std::string& line) {
    curl_slist* longer = curl_slist_append(headers_.get(), line.c_str());
    if (longer == nullptr) {
        return false;
    }
    // The longer list is the same one: nothing may free it in between.
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
    // Before the code, which only says that one of our functions has ended it.
    if (answer_.excess()) {
        return failedReply(kAnswerTooLarge, *answer_.excess());
    }
    if (trust_->refusal()) {
        return failedReply(kTrustRefused, base::concat("server not trusted: ", *trust_->refusal()));
    }
    const bool endedWithInterimAnswer = code == CURLE_GOT_NOTHING && status() != 0;
    if (code == CURLE_OK || endedWithInterimAnswer || isDecided()) {
        return response();
    }
    if (hasStageEnded_) {
        return failedReply(kTimedOut, base::concat("timed out: ", wordsFor(stage_.kind), " within ",
                                                   stage_.limit.count(), " ms"));
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
