#pragma once

#include "platform/https/HTTPTransfer.h"

#include <optional>

namespace https {

/// The options of the command line. None, with the status to end with, when there is nothing to do
/// but end.
[[nodiscard]] std::optional<platform::HTTPOptions> parseOptions(int argc, const char* const* argv,
                                                                int& exitStatus);

} // namespace https
