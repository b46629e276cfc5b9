#pragma once

#include "platform/KernelChannel.h"
#include "platform/ServiceRegistry.h"
#include "platform/Status.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <string>
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

} // namespace platform
