#pragma once

#include "KSTLib/Handle.h"

#include <functional>
#include <optional>
#include <string>

namespace keystrand {

/// Where the names of new contexts come from; none when there are none to be had.
using HandleSource = std::function<std::optional<KSTHandle>()>;

/// 16 bytes that nobody can guess.
[[nodiscard]] std::optional<KSTHandle> randomHandle();

/// Whether the handle is the one that stands for no context.
[[nodiscard]] bool isNoHandle(const KSTHandle& handle);

[[nodiscard]] std::string toHex(const KSTHandle& handle);

/// Handles by their bytes.
struct HandleOrder {
    [[nodiscard]] bool operator()(const KSTHandle& left, const KSTHandle& right) const;
};

} // namespace keystrand
