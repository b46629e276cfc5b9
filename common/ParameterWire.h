#pragma once

#include "KSTLib/PolicyVerification.h"
#include "KSTLib/Status.h"
#include "base/ByteReader.h"
#include "base/ByteWriter.h"

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
class ReceivedParameters {
  public:
    ReceivedParameters() = default;
    ReceivedParameters(const ReceivedParameters&) = delete;
    ReceivedParameters& operator=(const ReceivedParameters&) = delete;
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

} // namespace kst
