#pragma once

#include "platform/Error.h"

#include <optional>
#include <string>
#include <string_view>

namespace kstctl {

/// Makes the file, for its owner alone, with that content. A file that is there already is left as
/// it is, which is a failure; what could not be written whole is taken away again.
[[nodiscard]] std::optional<platform::Error> writeNewFile(const std::string& path,
                                                          std::string_view content);

} // namespace kstctl
