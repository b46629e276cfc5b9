#pragma once

#include "platform/https/HTTPTransfer.h"
#include "wire/HTTPConnection.h"

namespace https {

/// Takes the one request of the connection, makes it, and answers. False when what came was no
/// request; nothing is answered then. A daemon that hangs up ends the request.
[[nodiscard]] bool serve(wire::HTTPConnection& connection, const platform::HTTPOptions& options);

} // namespace https
