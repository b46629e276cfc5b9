#include "kstd-https/Daemon.h"

#include <algorithm>
#include <cstring>
#include <optional>

namespace https {

namespace {

using State = wire::HTTPConnectionState;
using platform::AuthenticationChallenge;
using platform::ChallengeDisposition;

/// How often the daemon hears that there is still somebody at work.
constexpr std::chrono::milliseconds kWorkingInterval{500};

} // namespace

std::size_t Daemon::giveBody(std::span<char> room) {
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

bool Daemon::isWaiting() {
    const auto now = std::chrono::steady_clock::now();
    if (now - told_ < kWorkingInterval) {
        return true;
    }
    told_ = now;
    return !connection_.isHungUp() && connection_.send(wire::encodeHTTPWorking()) == State::open;
}

void Daemon::didReceiveChallenge(const AuthenticationChallenge& challenge,
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

wire::HTTPVerdict Daemon::ask(const AuthenticationChallenge& challenge) {
    const auto question = wire::encodeHTTPChallenge(
        {challenge.method, static_cast<std::uint32_t>(challenge.previousFailureCount),
         challenge.trust != nullptr ? static_cast<std::uint32_t>(challenge.trust->evaluate()) : 0,
         challenge.host});
    wire::HTTPMessage message;
    if (!question || connection_.send(*question) != State::open ||
        connection_.receive(message) != State::open ||
        message.type != wire::HTTPMessageType::verdict) {
        return wire::HTTPVerdict::refuse;
    }
    return wire::decodeHTTPVerdict(message.fields).value_or(wire::HTTPVerdict::refuse);
}

} // namespace https
