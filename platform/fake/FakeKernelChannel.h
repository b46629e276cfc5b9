#pragma once

#include "platform/KernelChannel.h"
#include "platform/fake/FakeKernel.h"
#include "platform/fake/FakeServiceRegistry.h"

#include <cstddef>
#include <cstdint>

namespace platform {

/// The channel of one process to a FakeKernel. The registry, which knows what the service handles
/// stand for, outlives it.
class FakeKernelChannel final : public KernelChannel {
  public:
    /// What the channel can carry, as on the real one.
    static constexpr std::size_t kMaxStructInput = 131072 - 24;
    static constexpr std::uint32_t kMaxScalars = 16;

    FakeKernelChannel(FakeKernel& kernel, const FakeServiceRegistry& registry)
        : kernel_(kernel), registry_(registry) {}

    [[nodiscard]] Status open(ServiceHandle service, std::uint32_t connectionType,
                              ConnectionHandle* connection) override;
    [[nodiscard]] Status structCall(ConnectionHandle connection, std::uint32_t selector,
                                    const void* input, std::size_t inputSize, void* output,
                                    std::size_t* outputSize) override;
    [[nodiscard]] Status scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                    const std::uint64_t* inputs, std::uint32_t inputCount,
                                    std::uint64_t* outputs, std::uint32_t* outputCount) override;

  private:
    /// Why a call on the connection cannot reach the kernel side, or 0.
    [[nodiscard]] Status reach(ConnectionHandle connection) const;

    FakeKernel& kernel_;
    const FakeServiceRegistry& registry_;
    ConnectionHandle lastConnection_ = kNoConnection;
};

} // namespace platform
