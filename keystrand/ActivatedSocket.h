#pragma once

#include "base/FileDescriptor.h"

#include <optional>
#include <string>

namespace keystrand {

/// The listening SOCK_SEQPACKET socket that the init system handed over under the name `service`; a
/// closed descriptor when it handed over none. Any other socket that it handed over is closed.
/// None, with a reason for people in `error`, when what has that name is something else.
///
/// Takes the variables that announce sockets out of the environment, so it finds them once.
[[nodiscard]] std::optional<base::FileDescriptor> takeActivatedServiceSocket(std::string& error);

} // namespace keystrand
