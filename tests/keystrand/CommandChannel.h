#pragma once

#include "KSTLib/Command.h"
#include "keystrand/DispatchTable.h"
#include "platform/KernelChannel.h"
#include "tests/keystrand/Bytes.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace keystrand::test {

/// Carries the library's frames to commands in the same process.
class CommandChannel : public platform::KernelChannel {
  public:
    explicit CommandChannel(const DispatchTable& commands) : commands_(commands) {}

    platform::Status open(platform::ServiceHandle /*service*/, std::uint32_t /*connectionType*/,
                          platform::ConnectionHandle* connection) override {
        *connection = 1;
        return platform::kSuccess;
    }
    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* input,
                                std::size_t inputSize, void* output,
                                std::size_t* outputSize) override {
        const auto* bytes = static_cast<const std::uint8_t*>(input);
        frame.assign(bytes, bytes + inputSize);
        const auto decoded = decodeCommandFrame(frame);
        EXPECT_TRUE(decoded);
        CommandResult result = commands_.run(decoded->code, decoded->payload, *outputSize);
        std::copy(result.output.begin(), result.output.end(), static_cast<std::uint8_t*>(output));
        *outputSize = result.output.size();
        reply = std::move(result.output);
        return result.status;
    }
    platform::Status scalarCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const std::uint64_t* /*inputs*/,
                                std::uint32_t /*inputCount*/, std::uint64_t* /*outputs*/,
                                std::uint32_t* /*outputCount*/) override {
        return -1;
    }

    [[nodiscard]] ByteVector payload() const {
        return {frame.begin() + kKSTCommandHeaderSize, frame.end()};
    }

    ByteVector frame;
    ByteVector reply;

  private:
    const DispatchTable& commands_;
};

} // namespace keystrand::test
