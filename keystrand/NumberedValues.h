#pragma once

#include "KSTLib/Command.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <span>
#include <vector>

namespace keystrand {

/// Values of up to 64 bytes under numbers: the service's environment variables, the properties of a
/// context.
class NumberedValues {
  public:
    static constexpr std::size_t kMaxCount = 64;
    static constexpr std::size_t kMaxValueSize = kKSTEnvironmentVariableMaxSize;

    /// Sets a value; an empty one is removed. False, with nothing changed, when the value is too
    /// long or would be one too many.
    [[nodiscard]] bool set(std::uint32_t id, std::span<const std::uint8_t> value);

    /// The value, empty when it is not set. Valid until the next `set`.
    [[nodiscard]] std::span<const std::uint8_t> get(std::uint32_t id) const;

    [[nodiscard]] std::size_t count() const { return values_.size(); }

  private:
    std::map<std::uint32_t, std::vector<std::uint8_t>> values_;
};

} // namespace keystrand
