#pragma once

#include "common/Command.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <span>
#include <vector>

namespace sim {

/// The service's environment variables: a number names up to 64 bytes.
class EnvironmentVariables {
  public:
    static constexpr std::size_t kMaxCount = 64;
    static constexpr std::size_t kMaxValueSize = kKSTEnvironmentVariableMaxSize;

    /// Sets a variable; an empty value removes it. False, with nothing changed, when the value is
    /// too long or would be one variable too many.
    [[nodiscard]] bool set(std::uint32_t id, std::span<const std::uint8_t> value);

    /// The value, empty for a variable that is not set. Valid until the next `set`.
    [[nodiscard]] std::span<const std::uint8_t> get(std::uint32_t id) const;

    [[nodiscard]] std::size_t count() const { return values_.size(); }

  private:
    std::map<std::uint32_t, std::vector<std::uint8_t>> values_;
};

} // namespace sim
