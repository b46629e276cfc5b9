#pragma once

#include "base/FileDescriptor.h"
#include "platform/https/HTTPTransfer.h"
#include "wire/HTTPConnection.h"

#include <string>

namespace https {

/// The connection that this process was started with. None, and why, when there is none, or when
/// the other end is neither root nor this process's own user.
[[nodiscard]] base::FileDescriptor takeConnection(std::string& reason);

/// Takes the one request of the connection, makes it, and answers. False when what came was no
/// request; nothing is answered then. A daemon that hangs up ends the request.
[[nodiscard]] bool serve(wire::HTTPConnection& connection, const platform::HTTPOptions& options);

} // namespace https
