#pragma once

#include "kstctl/ExitStatus.h"
#include "kstctl/Report.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>

namespace kstctl::decode {

using Bytes = std::span<const std::uint8_t>;

/// How much of what is secret may be shown.
enum class Secrets { hidden, shown };

/// The fields of what stands at the start of some bytes.
struct Decoded {
    Report fields;
    /// How many bytes it takes; what follows them does not belong to it.
    std::size_t size = 0;
};

/// Fails with ExitStatus::malformed.
using Result = platform::Result<Decoded>;
using Decoder = Result (*)(Bytes bytes, Secrets secrets);

[[nodiscard]] inline platform::Error malformed(std::string reason) {
    return failure(ExitStatus::malformed, std::move(reason));
}

} // namespace kstctl::decode
