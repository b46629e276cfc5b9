#pragma once

#include <string_view>

namespace platform {

/// Ends the process with a message: a test has asked a double for something that has no sensible
/// answer, such as to wait for ever.
[[noreturn]] void testError(std::string_view message);

} // namespace platform
