#pragma once

#include "platform/HTTPSession.h"
#include "platform/https/HTTPTransfer.h"
#include "wire/HTTPConnection.h"

#include <chrono>
#include <cstdint>

namespace https {

/// The daemon at the other end of the connection, while its request is made: it gives the body and
/// decides about challenges. Once it has hung up or broken the rules, it gives nothing and refuses
/// everything.
class Daemon final : public platform::HTTPCaller, public platform::HTTPSessionDelegate {
  public:
    /// The connection must outlast this.
    Daemon(wire::HTTPConnection& connection, std::uint64_t bodySize)
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

} // namespace https
