#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace platform {

[[nodiscard]] inline std::span<const std::uint8_t> asBytes(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

[[nodiscard]] inline std::span<const std::uint8_t> asBytes(const void* data, std::size_t size) {
    return {static_cast<const std::uint8_t*>(data), size};
}

} // namespace platform
