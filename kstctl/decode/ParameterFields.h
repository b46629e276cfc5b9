#pragma once

#include "KSTLib/Parameter.h"
#include "kstctl/Report.h"

#include <cstddef>

namespace kstctl::decode {

/// The parameters of a verify request as a deserialiser hands them out, given back at the end of
/// the scope.
struct ReceivedParameters {
    ReceivedParameters() = default;
    ReceivedParameters(const ReceivedParameters&) = delete;
    ReceivedParameters& operator=(const ReceivedParameters&) = delete;
    ~ReceivedParameters();

    /// What they take on the wire, their number not counted.
    [[nodiscard]] std::size_t wireSize() const;
    [[nodiscard]] Data fields() const;

    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

} // namespace kstctl::decode
