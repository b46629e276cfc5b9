#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace support {

/// A result block that keeps what it is called with.
class RecordingBlock {
  public:
    struct Call {
        bool wasNull;
        std::size_t length;
        std::vector<std::uint8_t> bytes;
    };

    void operator()(const void* data, std::size_t length) {
        const auto* bytes = static_cast<const std::uint8_t*>(data);
        calls.push_back({data == nullptr, length,
                         data == nullptr ? std::vector<std::uint8_t>()
                                         : std::vector<std::uint8_t>(bytes, bytes + length)});
    }

    std::vector<Call> calls;
};

} // namespace support
