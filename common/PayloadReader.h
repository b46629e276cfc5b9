#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Status.h"
#include "base/ByteReader.h"
#include "common/AssertLine.h"
#include "common/ParameterWire.h"
#include "common/SerializationContext.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// Where a caller wants what every payload with parameters has. Any may be null.
struct PayloadOutputs {
    KSTHandle* handle;
    std::uint32_t* maxGlobalCredentialAge;
    KSTParameter** parameters;
    std::uint32_t* parametersCount;
};

/// Reads a payload that begins with a handle and ends with the age and the parameters.
///
/// `begin`, then what stands between in such a payload alone, from `rest`, then `finish`; each
/// once, and none after a failure. Every failure writes its line. What was allocated for parameters
/// is released with the object unless `finish` handed it out.
class PayloadReader {
  public:
    PayloadReader(const void* buffer, std::size_t size, const PayloadOutputs& outputs) noexcept
        : buffer_(buffer), outputs_(outputs), rest_(buffer, size) {}

    /// Checks the arguments: the buffer, the handle's place, those that this payload alone has, the
    /// other places. Then stores the handle, which stays whatever comes. kKSTErrorBadParameter: one
    /// is null, or the handle is not there.
    template <std::size_t Count>
    [[nodiscard]] KSTStatus begin(const Argument (&own)[Count]) noexcept {
        const AssertionContext context = serializationContext();
        KSTStatus err = context.requireArguments({
            Argument(buffer_, "buffer"),
            Argument(outputs_.handle, "handle"),
        });
        if (err == kKSTErrorSuccess) {
            err = context.requireArguments(own);
        }
        if (err == kKSTErrorSuccess) {
            err = context.requireArguments({
                Argument(outputs_.maxGlobalCredentialAge, "maxGlobalCredentialAge"),
                Argument(outputs_.parameters, "parameters"),
                Argument(outputs_.parametersCount, "parametersCount"),
            });
        }
        return err == kKSTErrorSuccess ? readHandle() : err;
    }

    /// What has not been read.
    [[nodiscard]] base::ByteReader& rest() noexcept { return rest_; }

    /// Reads a byte as 0 or 1. kKSTErrorBadParameter: there is none.
    [[nodiscard]] KSTStatus readFlag(std::uint8_t& flag) noexcept;

    /// Reads the age and the parameters and stores them. As ReceivedParameters::read.
    [[nodiscard]] KSTStatus finish() noexcept;

  private:
    [[nodiscard]] KSTStatus readHandle() noexcept;

    const void* buffer_;
    PayloadOutputs outputs_;
    base::ByteReader rest_;
    ReceivedParameters parameters_;
};

} // namespace kst
