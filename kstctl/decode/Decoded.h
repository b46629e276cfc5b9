#pragma once

#include "KSTLib/Status.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Report.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

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

/// Runs a deserialiser of the library. None when it succeeded; otherwise an error that names
/// `what` and the check that failed first.
[[nodiscard]] std::optional<platform::Error>
refusalOf(std::string_view what, const std::function<KSTStatus()>& deserialise);

/// What a deserialiser handed out, given back at the end of the scope by `Release`, which knows how
/// much it is.
template <typename Made>
using Received = std::unique_ptr<Made, std::function<void(Made*)>>;

} // namespace kstctl::decode
