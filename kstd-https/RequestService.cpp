#include "kstd-https/RequestService.h"

#include "base/Concat.h"
#include "platform/HTTPSession.h"
#include "platform/host/HTTPRequests.h"
#include "platform/https/HTTPTransfer.h"
#include "wire/HTTPMessages.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <sys/socket.h>
#include <unistd.h>

namespace https {

namespace {

bool hasOption(int socket, int option, int wanted) {
    int value = -1;
    socklen_t size = sizeof value;
    return ::getsockopt(socket, SOL_SOCKET, option, &value, &size) == 0 && value == wanted;
}

bool isLocalConnection(int socket) {
    sockaddr_storage peer{};
    socklen_t size = sizeof peer;
    return hasOption(socket, SO_DOMAIN, AF_UNIX) && hasOption(socket, SO_TYPE, SOCK_STREAM) &&
           ::getpeername(socket, reinterpret_cast<sockaddr*>(&peer), &size) == 0;
}

} // namespace

base::FileDescriptor takeConnection(std::string& reason) {
    constexpr int kSocket = wire::kHTTPConnectionDescriptor;
    // Looked at before it is owned: in a program that is started by hand the descriptor may be
    // anybody's.
    if (!isLocalConnection(kSocket)) {
        reason = base::concat("descriptor ", kSocket, " is no connection of a local stream socket");
        return base::FileDescriptor();
    }
    base::FileDescriptor connection(kSocket);
    ::fcntl(kSocket, F_SETFD, FD_CLOEXEC);
    ucred peer{};
    socklen_t size = sizeof peer;
    if (::getsockopt(kSocket, SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0 ||
        (peer.uid != 0 && peer.uid != ::geteuid())) {
        reason = base::concat("refused a connection of user ", peer.uid);
        return base::FileDescriptor();
    }
    return connection;
}

namespace {

using State = wire::HTTPConnectionState;
using platform::AuthenticationChallenge;
using platform::ChallengeDisposition;

/// The daemon at the other end of the connection, while its request is made: it gives the body and
/// decides about challenges. Once it has hung up or broken the rules, it gives nothing and refuses
/// everything.
class RequestingDaemon final : public platform::HTTPCaller, public platform::HTTPSessionDelegate {
  public:
    /// The connection must outlast this.
    RequestingDaemon(wire::HTTPConnection& connection, std::uint64_t bodySize)
        : connection_(connection), bodySize_(bodySize), bodyLeft_(bodySize) {}

    [[nodiscard]] std::uint64_t bodySize() const override { return bodySize_; }
    [[nodiscard]] std::size_t giveBody(std::span<char> room) override;
    [[nodiscard]] bool isWaiting() override;

    void didReceiveChallenge(const platform::AuthenticationChallenge& challenge,
                             const platform::ChallengeCompletion& completion) override;

  private:
    [[nodiscard]] wire::HTTPVerdict ask(const platform::AuthenticationChallenge& challenge);

    wire::HTTPConnection& connection_;
    std::uint64_t bodySize_;
    std::uint64_t bodyLeft_;
    std::chrono::steady_clock::time_point told_{};
};

/// How often the daemon hears that there is still somebody at work.
constexpr std::chrono::milliseconds kWorkingInterval{500};

std::size_t RequestingDaemon::giveBody(std::span<char> room) {
    const std::uint64_t most =
        std::min({std::uint64_t{room.size()}, bodyLeft_, std::uint64_t{wire::kHTTPMaxPieceSize}});
    wire::HTTPMessage message;
    if (most == 0 ||
        connection_.send(wire::encodeHTTPBodyWanted(static_cast<std::uint32_t>(most))) !=
            State::open ||
        connection_.receive(message) != State::open ||
        message.type != wire::HTTPMessageType::piece || message.fields.size() > most) {
        return 0;
    }
    std::memcpy(room.data(), message.fields.data(), message.fields.size());
    bodyLeft_ -= message.fields.size();
    return message.fields.size();
}

bool RequestingDaemon::isWaiting() {
    const auto now = std::chrono::steady_clock::now();
    if (now - told_ < kWorkingInterval) {
        return true;
    }
    told_ = now;
    return !connection_.isHungUp() && connection_.send(wire::encodeHTTPWorking()) == State::open;
}

void RequestingDaemon::didReceiveChallenge(const AuthenticationChallenge& challenge,
                                           const platform::ChallengeCompletion& completion) {
    switch (ask(challenge)) {
    case wire::HTTPVerdict::accept:
        completion(ChallengeDisposition::useCredential,
                   platform::ServerTrustCredential{challenge.trust});
        return;
    case wire::HTTPVerdict::leaveToEvaluation:
        completion(ChallengeDisposition::performDefaultHandling, std::nullopt);
        return;
    case wire::HTTPVerdict::refuse:
        break;
    }
    completion(ChallengeDisposition::cancel, std::nullopt);
}

wire::HTTPVerdict RequestingDaemon::ask(const AuthenticationChallenge& challenge) {
    const auto question = wire::encodeHTTPChallenge(
        {challenge.method, static_cast<std::uint32_t>(challenge.previousFailureCount),
         challenge.trust != nullptr ? static_cast<std::uint32_t>(challenge.trust->evaluate()) : 0,
         challenge.host});
    wire::HTTPMessage message;
    // Whatever goes wrong on the way to a verdict is a refusal.
    if (!question || connection_.send(*question) != State::open ||
        connection_.receive(message) != State::open ||
        message.type != wire::HTTPMessageType::verdict) {
        return wire::HTTPVerdict::refuse;
    }
    return wire::decodeHTTPVerdict(message.fields).value_or(wire::HTTPVerdict::refuse);
}

std::optional<wire::HTTPRequestFields> receiveRequest(wire::HTTPConnection& connection) {
    wire::HTTPMessage message;
    if (connection.receive(message) != State::open ||
        message.type != wire::HTTPMessageType::request) {
        return std::nullopt;
    }
    auto fields = wire::decodeHTTPRequest(message.fields);
    return fields && (fields->bodySize == 0 || fields->method == "POST") ? fields : std::nullopt;
}

platform::HTTPReply replyTo(wire::HTTPConnection& connection, const wire::HTTPRequestFields& fields,
                            const platform::HTTPOptions& options) {
    const platform::HTTPRequest request{.method = std::string(fields.method),
                                        .link = platform::Link{std::string(fields.link)},
                                        .maximumAnswerSize = fields.maximumAnswerSize};
    if (auto refusal = platform::refusalOf(request)) {
        return *std::move(refusal);
    }
    const auto daemon = std::make_shared<RequestingDaemon>(connection, fields.bodySize);
    platform::HTTPTransferSettings settings{.options = options};
    settings.headers.insert(fields.headers.begin(), fields.headers.end());
    if (fields.hasDelegate) {
        settings.delegate = daemon;
    }
    return platform::HTTPTransfer(request, settings, *daemon).perform();
}

/// As much of the text as a message takes, in one line.
std::string lineOf(std::string_view text) {
    std::string line(text.substr(0, wire::kHTTPMaxDescriptionLength));
    std::replace_if(
        line.begin(), line.end(),
        [](char c) {
            const auto byte = static_cast<unsigned char>(c);
            return byte < 0x20 || byte == 0x7f;
        },
        '?');
    return line;
}

std::optional<wire::HTTPMessageBytes> messageFor(const platform::HTTPReply& reply) {
    if (reply.error) {
        return wire::encodeHTTPFailure(
            {reply.error->code, reply.error->domain, lineOf(reply.error->description)});
    }
    return wire::encodeHTTPResponse(
        {reply.response->status, reply.body.size(), reply.response->className});
}

void answer(wire::HTTPConnection& connection, const platform::HTTPReply& reply) {
    const auto message = messageFor(reply);
    State state = message ? connection.send(*message) : State::malformed;
    std::span<const std::uint8_t> left(reinterpret_cast<const std::uint8_t*>(reply.body.data()),
                                       reply.body.size());
    while (state == State::open && !left.empty()) {
        const auto piece = left.first(std::min(left.size(), wire::kHTTPMaxPieceSize));
        state = connection.sendPiece(piece);
        left = left.subspan(piece.size());
    }
}

} // namespace

bool serve(wire::HTTPConnection& connection, const platform::HTTPOptions& options) {
    const auto request = receiveRequest(connection);
    if (!request) {
        return false;
    }
    answer(connection, replyTo(connection, *request, options));
    return true;
}

} // namespace https
