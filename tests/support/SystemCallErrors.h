#pragma once

#include "tests/support/SystemCallGate.h"

#include <string>
#include <vector>

namespace support {

/// The name of a system call that `errorsOf` knows; otherwise its number.
[[nodiscard]] std::string nameOf(const SystemCall& call);

/// What a call is about: a file's path, or the kind of what is behind its descriptor ("socket",
/// "pipe", "eventpoll" ...); empty when it is about neither.
[[nodiscard]] std::string objectOf(const SystemCall& call);

/// The errors that the kernel may give a program that makes no mistake: those of manual section 2
/// without the ones that tell of wrong arguments, with EIO where a disk can fail. Empty for a call
/// that cannot fail.
[[nodiscard]] std::vector<int> errorsOf(const SystemCall& call);

/// Whether an error is not to be expected again and again: a signal interrupts once, what is not
/// ready after all is ready soon, the clock is not set all the time, and locks are given back.
[[nodiscard]] bool passes(const std::string& call, int error);

} // namespace support
