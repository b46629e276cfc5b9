#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Status.h"
#include "base/ByteReader.h"
#include "base/ByteWriter.h"
#include "base/NotCopied.h"
#include "common/Failure.h"

#include <cstddef>
#include <cstdint>

/// The part that the verify-policy, verify-ACL-constraint and process-ACL payloads share: their
/// parameters.
namespace kst {

/// A caller's parameters must be an array with its count, or neither, and at most
/// kKSTMaxParameters. Otherwise kKSTErrorBadParameter.
[[nodiscard]] KSTStatus checkParameterList(const KSTParameter* parameters,
                                           std::uint32_t parametersCount) noexcept;

/// Stores how long a caller's parameters are on the wire. As GetSerializedParametersLength, with a
/// line more.
[[nodiscard]] KSTStatus measureParameters(const KSTParameter* parameters,
                                          std::uint32_t parametersCount,
                                          std::uint32_t& length) noexcept;

/// What a writer of a payload checks behind its own arguments: the parameters as a list, then the
/// buffer and its size, which must not be null.
[[nodiscard]] KSTStatus checkWriter(const KSTParameter* parameters, std::uint32_t parametersCount,
                                    const void* outBuffer, const void* outSize) noexcept;

/// Each of a caller's parameters must be valid and have as many bytes as it says. Otherwise
/// kKSTErrorBadParameter.
[[nodiscard]] KSTStatus checkParameters(const KSTParameter* parameters,
                                        std::uint32_t parametersCount) noexcept;

/// Writes the count and the parameters. False when they do not fit.
[[nodiscard]] bool writeParameters(base::ByteWriter& writer, const KSTParameter* parameters,
                                   std::uint32_t parametersCount) noexcept;

/// The age and the parameters at the end of a payload, released with the object unless they were
/// handed out.
class ReceivedParameters : private base::NotCopied {
  public:
    ~ReceivedParameters();

    /// Reads the age, the count and the parameters. kKSTErrorBadParameter: they are cut short, more
    /// than kKSTMaxParameters, or one is not valid. kKSTErrorOutOfMemory. To be called once.
    [[nodiscard]] KSTStatus read(base::ByteReader& reader) noexcept;

    /// Stores what was read. The caller owns the parameters from now on.
    void handOut(std::uint32_t& maxGlobalCredentialAge, KSTParameter*& parameters,
                 std::uint32_t& parametersCount) noexcept;

  private:
    [[nodiscard]] static KSTStatus readElement(base::ByteReader& reader,
                                               KSTParameter& element) noexcept;

    std::uint32_t maxGlobalCredentialAge_ = 0;
    KSTParameter* parameters_ = nullptr;
    std::uint32_t parametersCount_ = 0;
};

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
        KSTStatus err = requireArguments(context, {
                                                      Argument(buffer_, "buffer"),
                                                      Argument(outputs_.handle, "handle"),
                                                  });
        if (err == kKSTErrorSuccess) {
            err = requireArguments(context, own);
        }
        if (err == kKSTErrorSuccess) {
            err = requireArguments(
                context, {
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
