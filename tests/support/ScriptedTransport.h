#pragma once

#include "KSTLib/LibCall.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <vector>

namespace support {

/// A transport that answers what the test says and keeps what it was handed. Pass `function` and
/// the object itself as context.
class ScriptedTransport {
  public:
    struct Call {
        std::uint32_t code;
        std::uint32_t thirdByte;
        std::vector<std::uint8_t> input;
        const void* output;
        /// None when no size was given.
        std::optional<std::size_t> offeredSize;
        /// Whether every byte offered was zero.
        bool outputWasZero;
    };

    KSTStatus status = kKSTErrorSuccess;
    /// Written whatever the status is, as far as there is room.
    std::vector<std::uint8_t> reply;
    /// None leaves the size as it was offered.
    std::optional<std::size_t> reportedSize;

    std::vector<Call> calls;

    static KSTStatus function(void* context, std::uint32_t code, std::uint32_t thirdByte,
                              const void* inData, std::size_t inSize, void* outData,
                              std::size_t* outSize) {
        return static_cast<ScriptedTransport*>(context)->answer(
            {code, thirdByte, bytesAt(inData, inSize), outData,
             outSize != nullptr ? std::optional(*outSize) : std::nullopt, true},
            static_cast<std::uint8_t*>(outData), outSize);
    }

  private:
    static std::vector<std::uint8_t> bytesAt(const void* data, std::size_t size) {
        const auto* bytes = static_cast<const std::uint8_t*>(data);
        return {bytes, bytes + size};
    }

    KSTStatus answer(Call call, std::uint8_t* outData, std::size_t* outSize) {
        const std::size_t room = call.offeredSize.value_or(0);
        call.outputWasZero =
            std::all_of(outData, outData + room, [](std::uint8_t byte) { return byte == 0; });
        calls.push_back(std::move(call));
        const std::size_t length = std::min(reply.size(), room);
        if (length > 0) {
            std::memcpy(outData, reply.data(), length);
        }
        if (outSize != nullptr && reportedSize) {
            *outSize = *reportedSize;
        }
        return status;
    }
};

} // namespace support
