#pragma once

#include "platform/KernelChannel.h"

#include <algorithm>
#include <cstring>
#include <functional>
#include <optional>
#include <vector>

namespace support {

/// A kernel channel that answers what the test says and keeps what it was sent.
class ScriptedChannel : public platform::KernelChannel {
  public:
    static constexpr platform::ConnectionHandle kConnection = 4711;

    struct Open {
        platform::ServiceHandle service;
        std::uint32_t connectionType;
    };
    struct StructCall {
        platform::ConnectionHandle connection;
        std::uint32_t selector;
        std::vector<std::uint8_t> input;
        const void* output;
        /// None when no size was given.
        std::optional<std::size_t> offeredSize;
        /// Whether every byte offered was zero.
        bool outputWasZero;
    };
    struct ScalarCall {
        platform::ConnectionHandle connection;
        std::uint32_t selector;
        std::uint32_t inputCount;
        std::uint32_t offeredCount;
    };

    platform::Status openStatus = platform::kSuccess;
    platform::Status structStatus = platform::kSuccess;
    platform::Status scalarStatus = platform::kSuccess;
    std::vector<std::uint8_t> reply;
    /// Reported in place of the size of `reply`.
    std::optional<std::size_t> reportedSize;
    std::vector<std::uint64_t> scalars;
    /// Called within every struct call.
    std::function<void()> duringStructCall;

    std::vector<Open> opens;
    std::vector<StructCall> structCalls;
    std::vector<ScalarCall> scalarCalls;

    platform::Status open(platform::ServiceHandle service, std::uint32_t connectionType,
                          platform::ConnectionHandle* connection) override {
        opens.push_back({service, connectionType});
        if (openStatus == platform::kSuccess) {
            *connection = kConnection;
        }
        return openStatus;
    }

    platform::Status structCall(platform::ConnectionHandle connection, std::uint32_t selector,
                                const void* input, std::size_t inputSize, void* output,
                                std::size_t* outputSize) override {
        const std::size_t room = outputSize != nullptr ? *outputSize : 0;
        const auto* in = static_cast<const std::uint8_t*>(input);
        auto* out = static_cast<std::uint8_t*>(output);
        structCalls.push_back({connection,
                               selector,
                               {in, in + inputSize},
                               output,
                               outputSize != nullptr ? std::optional(*outputSize) : std::nullopt,
                               room == 0 || std::all_of(out, out + room, [](std::uint8_t byte) {
                                   return byte == 0;
                               })});
        if (duringStructCall) {
            duringStructCall();
        }
        if (structStatus != platform::kSuccess) {
            return structStatus;
        }
        const std::size_t length = std::min(reply.size(), room);
        if (length > 0) {
            std::memcpy(output, reply.data(), length);
        }
        if (outputSize != nullptr) {
            *outputSize = reportedSize.value_or(reply.size());
        }
        return platform::kSuccess;
    }

    platform::Status scalarCall(platform::ConnectionHandle connection, std::uint32_t selector,
                                const std::uint64_t* /*inputs*/, std::uint32_t inputCount,
                                std::uint64_t* outputs, std::uint32_t* outputCount) override {
        scalarCalls.push_back({connection, selector, inputCount, *outputCount});
        if (scalarStatus != platform::kSuccess) {
            return scalarStatus;
        }
        std::copy_n(scalars.begin(), std::min<std::size_t>(scalars.size(), *outputCount), outputs);
        *outputCount = static_cast<std::uint32_t>(scalars.size());
        return platform::kSuccess;
    }
};

} // namespace support
