#pragma once

#include "base/NotCopied.h"
#include "platform/KernelChannel.h"
#include "platform/ServiceRegistry.h"
#include "tests/platform/contract/ContractTest.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace contract {

/// What the kernel side shall answer to the next call.
struct KernelAnswer {
    platform::Status status = platform::kSuccess;
    std::vector<std::uint8_t> output;
};

/// A process with its registry and channel, and a kernel side with the entry
/// "IOService:/IOResources/Keystrand" of the class "Keystrand", without properties, that answers
/// success without output.
struct KernelFixture : private base::NotCopied {
    virtual ~KernelFixture() = default;

    virtual platform::ServiceRegistry& registry() = 0;
    virtual platform::KernelChannel& channel() = 0;

    /// The kernel side goes, or comes back as it was.
    virtual void setReachable(bool reachable) = 0;

    /// Its entry goes, or comes back.
    virtual void setEntryPresent(bool present) = 0;

    /// None takes the property away.
    virtual void setProperty(const std::string& name,
                             const std::optional<std::vector<std::uint8_t>>& value) = 0;

    /// The status of the opens to come.
    virtual void setOpenStatus(platform::Status status) = 0;

    virtual void answerStructCall(const KernelAnswer& answer) = 0;
    virtual void answerScalarCall(platform::Status status,
                                  const std::vector<std::uint64_t>& outputs) = 0;

    struct StructCall {
        std::uint32_t selector = 0;
        std::vector<std::uint8_t> input;
        std::size_t offeredSize = 0;

        friend bool operator==(const StructCall&, const StructCall&) = default;
    };
    struct ScalarCall {
        std::uint32_t selector = 0;
        std::vector<std::uint64_t> inputs;
        std::uint32_t offeredCount = 0;

        friend bool operator==(const ScalarCall&, const ScalarCall&) = default;
    };

    /// What has reached the kernel side.
    [[nodiscard]] virtual std::vector<StructCall> structCalls() = 0;
    [[nodiscard]] virtual std::vector<ScalarCall> scalarCalls() = 0;
    [[nodiscard]] virtual std::vector<std::uint32_t> openedTypes() = 0;

    /// The longest input of a struct call that the channel can carry.
    [[nodiscard]] virtual std::size_t maxStructInput() = 0;
};

class KernelContract : public ContractTest<KernelFixture> {
  protected:
    [[nodiscard]] platform::ServiceRegistry& registry() { return fixture().registry(); }
    [[nodiscard]] platform::KernelChannel& channel() { return fixture().channel(); }

    [[nodiscard]] platform::ServiceHandle find();

    /// An open connection of type 0.
    [[nodiscard]] platform::ConnectionHandle connect();

    /// A struct call on a buffer of `offered` bytes of 0xee, which is compared afterwards.
    struct Outcome {
        platform::Status status = platform::kSuccess;
        std::vector<std::uint8_t> buffer;
        std::size_t size = 0;
    };
    [[nodiscard]] Outcome call(platform::ConnectionHandle connection,
                               const std::vector<std::uint8_t>& input, std::size_t offered);
};

} // namespace contract
