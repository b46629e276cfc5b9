#pragma once

#include "KSTLib/Status.h"
#include "kstctl/decode/Decoded.h"

#include <functional>
#include <memory>
#include <optional>
#include <string_view>

namespace kstctl::decode {

/// Runs a deserialiser of the library. None when it succeeded; otherwise an error that names
/// `what` and the check that failed first.
[[nodiscard]] std::optional<platform::Error>
refusalOf(std::string_view what, const std::function<KSTStatus()>& deserialise);

/// What a deserialiser handed out, given back at the end of the scope by `Release`, which knows how
/// much it is.
template <typename Made>
using Received = std::unique_ptr<Made, std::function<void(Made*)>>;

} // namespace kstctl::decode
