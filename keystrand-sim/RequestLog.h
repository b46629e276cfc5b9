#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <span>
#include <vector>

namespace keystrand::sim {

/// One struct call that was received.
struct LoggedRequest {
    /// 1 for the first.
    std::uint64_t index = 0;
    /// None when the input was not a command frame; the payload is then the whole input.
    std::optional<std::uint8_t> command;
    std::optional<std::uint32_t> control;
    /// Without the bytes that are withheld from its end.
    std::vector<std::uint8_t> payload;
    /// How many bytes are not kept, because there is a credential in them.
    std::size_t withheld = 0;
    std::optional<std::uint8_t> credentialType;
    /// None when no status was sent.
    std::optional<std::int32_t> status;
    /// A notification was acknowledged by it.
    bool acknowledged = false;
};

/// The struct calls in the order in which they came. Old ones are forgotten when there are too
/// many; the counts go on.
class RequestLog {
  public:
    static constexpr std::size_t kMaxEntries = 200'000;
    static constexpr std::size_t kMaxPayloadBytes = std::size_t{32} * 1024 * 1024;
    /// Control codes beyond so many different ones are not counted one by one.
    static constexpr std::size_t kMaxCountedControls = 256;

    using Observer = std::function<void()>;

    /// Called after every request that is recorded.
    void setObserver(Observer observer);

    /// Gives the request its index.
    void record(LoggedRequest request);
    /// Forgets everything, counts included.
    void clear();

    [[nodiscard]] const std::deque<LoggedRequest>& entries() const { return entries_; }
    [[nodiscard]] std::uint64_t count() const { return count_; }
    [[nodiscard]] std::uint64_t acknowledgements() const { return acknowledgements_; }
    [[nodiscard]] std::uint64_t controlCount(std::uint32_t control) const;

  private:
    void countIn(const LoggedRequest& request);
    void dropOldest();

    std::deque<LoggedRequest> entries_;
    std::size_t payloadBytes_ = 0;
    std::uint64_t count_ = 0;
    std::uint64_t acknowledgements_ = 0;
    std::map<std::uint32_t, std::uint64_t> controlCounts_;
    Observer observer_ = [] {
    };
};

/// What the request log leaves out of an input that carries a credential.
struct Withholding {
    /// How many bytes from the start may be kept.
    std::size_t kept = 0;
    /// The type of the credential, if the input has one in its place.
    std::optional<std::uint8_t> credentialType;
};

/// None for a command that carries no credential. Of those that do, the handle may be kept.
[[nodiscard]] std::optional<Withholding> withholdingFrom(std::uint8_t command,
                                                         std::span<const std::uint8_t> payload);

} // namespace keystrand::sim
