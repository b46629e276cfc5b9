#pragma once

#include "base/FileDescriptor.h"

#include <string>

namespace https {

/// The connection that this process was started with. None, and why, when there is none, or when
/// the other end is neither root nor this process's own user.
[[nodiscard]] base::FileDescriptor takeConnection(std::string& reason);

} // namespace https
