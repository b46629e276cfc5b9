#pragma once

#include "KSTLib/DataBlob.h"
#include "kstctl/decode/Decoded.h"

namespace kstctl::decode {

/// Bytes that a deserialiser hands out, given back at the end of the scope.
struct ReceivedBlob {
    ReceivedBlob() = default;
    ReceivedBlob(const ReceivedBlob&) = delete;
    ReceivedBlob& operator=(const ReceivedBlob&) = delete;
    ~ReceivedBlob() { DeallocDataBlob(data, length); }

    [[nodiscard]] Bytes bytes() const { return {static_cast<const std::uint8_t*>(data), length}; }

    void* data = nullptr;
    std::uint32_t length = 0;
};

} // namespace kstctl::decode
