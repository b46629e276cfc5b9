#include "platform/linux/RemoteHTTPExchange.h"

#include "base/Concat.h"
#include "base/Saturate.h"
#include "platform/host/HTTPRequests.h"
#include "platform/linux/AsBytes.h"

#include <algorithm>
#include <cstdint>
#include <utility>

namespace platform {

namespace {

/// The trust that the client has evaluated.
class ReportedTrust final : public ServerTrust {
  public:
    explicit ReportedTrust(std::uint32_t result) : result_(static_cast<TrustResult>(result)) {}

    [[nodiscard]] TrustResult evaluate() override { return result_; }

  private:
    TrustResult result_;
};

wire::HTTPVerdict verdictFor(ChallengeOutcome outcome) {
    switch (outcome) {
    case ChallengeOutcome::accepted:
        return wire::HTTPVerdict::accept;
    case ChallengeOutcome::leftToEvaluation:
        return wire::HTTPVerdict::leaveToEvaluation;
    case ChallengeOutcome::refused:
        break;
    }
    return wire::HTTPVerdict::refuse;
}

bool isTransportError(const wire::HTTPFailureFields& failure) {
    return failure.domain == kTransportErrorDomain && failure.code >= kUnsupportedLink &&
           failure.code <= kTransferFailed;
}

std::string_view asText(std::span<const std::uint8_t> bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

} // namespace

RemoteHTTPExchange::RemoteHTTPExchange(wire::HTTPConnection& connection, const HTTPRequest& request,
                                       const RemoteHTTPSettings& settings)
    : connection_(connection),
      request_(request),
      settings_(settings),
      limit_(settings.options.limits.whole(request.method, request.bodySize()) +
             settings.options.grace),
      end_(wire::HTTPConnection::Clock::now() + limit_),
      hasDelegate_(!settings.delegate.expired()),
      bodyLeft_(isPost() ? request.bodySize() : 0) {}

HTTPReply RemoteHTTPExchange::perform() {
    const auto request = requestMessage();
    if (!request) {
        return failedReply(kTransferFailed,
                           "transfer failed: the request does not fit into a message");
    }
    connection_.endAt(end_);
    State state = connection_.send(*request);
    while (state == State::open && !reply_) {
        wire::HTTPMessage message;
        state = connection_.receive(message);
        if (state == State::open) {
            state = handle(message);
        }
    }
    return state == State::open ? *std::move(reply_) : replyFor(state);
}

std::optional<wire::HTTPMessageBytes> RemoteHTTPExchange::requestMessage() const {
    wire::HTTPRequestFields fields{.method = request_.method,
                                   .link = request_.link->text,
                                   .bodySize = bodyLeft_,
                                   .maximumAnswerSize = std::min<std::uint64_t>(
                                       request_.maximumAnswerSize, wire::kHTTPMaxBodySize),
                                   .hasDelegate = hasDelegate_};
    fields.headers.assign(settings_.headers.begin(), settings_.headers.end());
    return wire::encodeHTTPRequest(fields);
}

RemoteHTTPExchange::State RemoteHTTPExchange::handle(const wire::HTTPMessage& message) {
    using Type = wire::HTTPMessageType;
    // An answer that has come counts, even when this process is asked to end.
    const bool isAnswer = message.type == Type::failure || message.type == Type::response;
    if (!isAnswer && settings_.options.mustStop()) {
        return State::interrupted;
    }
    switch (message.type) {
    case Type::working:
        return State::open;
    case Type::challenge:
        return judge(message.fields);
    case Type::bodyWanted:
        return giveBody(message.fields);
    case Type::failure:
        return takeFailure(message.fields);
    case Type::response:
        return takeResponse(message.fields);
    case Type::request:
    case Type::verdict:
    case Type::piece:
        break;
    }
    return State::malformed;
}

RemoteHTTPExchange::State RemoteHTTPExchange::judge(std::span<const std::uint8_t> fields) {
    const auto facts = wire::decodeHTTPChallenge(fields);
    if (!facts || !hasDelegate_ || ++challenges_ > kMaximumChallenges) {
        return State::malformed;
    }
    ReportedTrust trust(facts->evaluation);
    const AuthenticationChallenge challenge{
        std::string(facts->method),
        base::saturate<int>(facts->previousFailureCount),
        facts->method == kServerTrustMethod ? &trust : nullptr,
        std::string(facts->host),
    };
    return connection_.send(
        wire::encodeHTTPVerdict(verdictFor(askDelegate(settings_.delegate, challenge))));
}

RemoteHTTPExchange::State RemoteHTTPExchange::giveBody(std::span<const std::uint8_t> fields) {
    const auto most = wire::decodeHTTPBodyWanted(fields);
    if (!most || bodyLeft_ == 0) {
        return State::malformed;
    }
    const auto piece = nextPiece(static_cast<std::size_t>(
        std::min<std::uint64_t>({*most, wire::kHTTPMaxPieceSize, bodyLeft_})));
    if (piece.empty()) {
        reply_ = failedReply(kTransferFailed, "transfer failed: the body cannot be read");
        return State::open;
    }
    bodyLeft_ -= piece.size();
    return connection_.sendPiece(asBytes(piece));
}

std::string_view RemoteHTTPExchange::nextPiece(std::size_t most) {
    if (request_.pieces != nullptr) {
        return request_.pieces->next(most);
    }
    return request_.body.substr(request_.body.size() - static_cast<std::size_t>(bodyLeft_), most);
}

RemoteHTTPExchange::State RemoteHTTPExchange::takeFailure(std::span<const std::uint8_t> fields) {
    const auto failure = wire::decodeHTTPFailure(fields);
    if (!failure || !isTransportError(*failure)) {
        return State::malformed;
    }
    reply_ = failedReply(failure->code, std::string(failure->description));
    return State::open;
}

RemoteHTTPExchange::State RemoteHTTPExchange::takeResponse(std::span<const std::uint8_t> fields) {
    const auto response = wire::decodeHTTPResponse(fields);
    if (!response) {
        return State::malformed;
    }
    HTTPReply reply{
        std::nullopt, HTTPResponse{response->status, std::string(response->className)}, {}};
    // The status decides about a document; no body is waited for.
    if (isPost()) {
        reply_ = std::move(reply);
        return State::open;
    }
    if (response->bodySize > request_.maximumAnswerSize) {
        reply_ = failedReply(kAnswerTooLarge, describeTooLarge(request_.maximumAnswerSize));
        return State::open;
    }
    const State state = receiveBody(static_cast<std::size_t>(response->bodySize), reply.body);
    if (state == State::open) {
        reply_ = std::move(reply);
    }
    return state;
}

RemoteHTTPExchange::State RemoteHTTPExchange::receiveBody(std::size_t size, std::string& body) {
    // Room is made for what comes, not for what was announced.
    while (body.size() < size) {
        wire::HTTPMessage message;
        const State state = connection_.receive(message);
        if (state != State::open) {
            return state;
        }
        if (message.type != wire::HTTPMessageType::piece ||
            message.fields.size() > size - body.size()) {
            return State::malformed;
        }
        body.append(asText(message.fields));
    }
    return State::open;
}

HTTPReply RemoteHTTPExchange::replyFor(State state) const {
    switch (state) {
    case State::timedOut:
        if (wire::HTTPConnection::Clock::now() >= end_) {
            return failedReply(kTimedOut,
                               base::concat("timed out: the HTTPS client took longer than ",
                                            limit_.count(), " ms"));
        }
        return failedReply(kTimedOut, base::concat("timed out: the HTTPS client was silent for ",
                                                   settings_.options.silenceLimit.count(), " ms"));
    case State::malformed:
        return failedReply(kTransferFailed,
                           "transfer failed: the HTTPS client sent what it must not");
    case State::interrupted:
        return failedReply(kTransferFailed, kStoppedDescription);
    case State::hungUp:
    case State::open:
        break;
    }
    return failedReply(kTransferFailed,
                       "transfer failed: the HTTPS client ended without an answer");
}

} // namespace platform
