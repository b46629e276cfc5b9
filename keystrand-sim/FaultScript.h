#pragma once

#include "wire/KernelSocket.h"

#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::sim {

/// What is known of a request before it is handled.
struct RequestKind {
    wire::KernelOperation operation = wire::KernelOperation::findByPath;
    std::optional<std::uint8_t> command;
    std::optional<std::uint32_t> control;
};

/// Which requests a fault is for; what is not given matches every request.
struct FaultMatch {
    std::optional<wire::KernelOperation> operation;
    std::optional<std::uint8_t> command;
    std::optional<std::uint32_t> control;

    [[nodiscard]] bool matches(const RequestKind& request) const;
};

/// What happens to a matching request. The first group takes the place of handling it, unless
/// `perform` is set too; the second alters the answer that it gets.
struct FaultEffect {
    std::optional<std::int32_t> status;
    /// A successful reply with a body of that many pattern bytes.
    std::optional<std::uint32_t> replySize;
    /// That many bytes that are no reply at all.
    std::optional<std::uint32_t> garbageSize;
    bool silence = false;
    bool hangUp = false;

    std::optional<std::uint32_t> reported;
    bool wrongSequence = false;
    std::uint32_t delayMilliseconds = 0;

    bool perform = false;

    [[nodiscard]] bool replacesHandling() const;
    [[nodiscard]] bool isNothing() const;
};

/// The faults that a test has ordered. Each happens a number of times and is then forgotten.
class FaultScript {
  public:
    static constexpr std::size_t kMaxFaults = 64;
    static constexpr std::uint64_t kAlways = std::numeric_limits<std::uint64_t>::max();

    /// `times` is at least 1. False when there are too many faults.
    [[nodiscard]] bool add(const FaultMatch& match, const FaultEffect& effect, std::uint64_t times);
    [[nodiscard]] bool hideProperty(std::string_view name, std::uint64_t times);
    void refuseConnections(std::uint64_t times) { refusals_ = times; }
    void setEntryPresent(bool present) { entryPresent_ = present; }
    void clear() { *this = FaultScript(); }

    /// The effect of the oldest fault that matches; counts as one time.
    [[nodiscard]] std::optional<FaultEffect> take(const RequestKind& request);
    [[nodiscard]] bool takeHiddenProperty(std::string_view name);
    [[nodiscard]] bool takeRefusal();
    [[nodiscard]] bool entryPresent() const { return entryPresent_; }

    /// How many orders have not run out yet.
    [[nodiscard]] std::size_t pending() const;

  private:
    struct Fault {
        FaultMatch match;
        FaultEffect effect;
        std::uint64_t times = 1;
    };
    struct HiddenProperty {
        std::string name;
        std::uint64_t times = 1;
    };

    std::vector<Fault> faults_;
    std::vector<HiddenProperty> hidden_;
    std::uint64_t refusals_ = 0;
    bool entryPresent_ = true;
};

} // namespace keystrand::sim
