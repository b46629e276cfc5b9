#pragma once

#include "platform/KernelChannel.h"
#include "platform/KernelConnections.h"
#include "platform/ServiceRegistry.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// A struct call as it reached the kernel side.
struct FakeStructCall {
    ConnectionHandle connection = kNoConnection;
    std::uint32_t selector = 0;
    std::vector<std::uint8_t> input;
    std::size_t offeredSize = 0;
};

struct FakeStructAnswer {
    Status status = kSuccess;
    std::vector<std::uint8_t> output;
    /// The size to report, to which the output is cut or filled up with zeros; that of `output`
    /// when there is none.
    std::optional<std::size_t> reportedSize;
};

struct FakeScalarCall {
    ConnectionHandle connection = kNoConnection;
    std::uint32_t selector = 0;
    std::vector<std::uint64_t> inputs;
    std::uint32_t offeredCount = 0;
};

struct FakeScalarAnswer {
    Status status = kSuccess;
    std::vector<std::uint64_t> outputs;
};

struct FakeKernelOpen {
    std::string path;
    std::uint32_t connectionType = 0;
};

/// The kernel side of a machine: one registry entry and the calls that reach it, answered by a
/// script. It outlives the processes that talk to it; a test reads and writes its members.
class FakeKernel {
  public:
    /// The error of every connection while the kernel side is not there at all (ENOENT,
    /// ECONNREFUSED), or 0: it is there.
    int absence = 0;

    bool entryPresent = true;
    std::string path = "IOService:/IOResources/Keystrand";
    std::string className = "Keystrand";
    std::map<std::string, std::vector<std::uint8_t>, std::less<>> properties;

    /// The status of the opens to come.
    Status openStatus = kSuccess;

    /// The answers to the calls to come, first to last. When there is none left, the function
    /// answers; when there is no function, the answer is success without output.
    std::deque<FakeStructAnswer> structAnswers;
    std::function<FakeStructAnswer(const FakeStructCall&)> onStructCall;
    std::deque<FakeScalarAnswer> scalarAnswers;

    /// What has reached the kernel side.
    std::vector<FakeKernelOpen> opens;
    std::vector<FakeStructCall> structCalls;
    std::vector<FakeScalarCall> scalarCalls;
    std::vector<std::string> propertyReads;

    [[nodiscard]] bool hasEntry() const { return absence == 0 && entryPresent; }

    [[nodiscard]] FakeStructAnswer answer(const FakeStructCall& call);
    [[nodiscard]] FakeScalarAnswer answer(const FakeScalarCall& call);
};

/// The registry of a FakeKernel as one process sees it. Handles are counted.
class FakeServiceRegistry final : public ServiceRegistry {
  public:
    explicit FakeServiceRegistry(FakeKernel& kernel) : kernel_(kernel) {}

    [[nodiscard]] ServiceHandle findByPath(std::string_view path) override;
    [[nodiscard]] ServiceHandle findByClassName(std::string_view name) override;
    [[nodiscard]] std::optional<std::vector<std::uint8_t>>
    copyProperty(ServiceHandle entry, std::string_view name) override;
    void release(ServiceHandle entry) override;

    /// How many references the process holds.
    [[nodiscard]] std::size_t liveReferences() const;

    /// The registry path of an entry that is held, or an empty text.
    [[nodiscard]] std::string pathOf(ServiceHandle entry) const;

  private:
    struct Entry {
        std::string path;
        std::size_t references = 0;
    };

    [[nodiscard]] ServiceHandle hold();

    FakeKernel& kernel_;
    std::map<ServiceHandle, Entry> entries_;
    ServiceHandle lastHandle_ = kNoService;
};

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
