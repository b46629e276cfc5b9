#pragma once

#include "common/Status.h"
#include "platform/SystemLog.h"

#include <cstdint>

namespace kst {

/// Who reports a failed check, and where to.
struct AssertionContext {
    /// Null: nothing is written.
    platform::SystemLog* log;
    /// Begins the line, for example "KSTLib".
    const char* tag;
    /// The source path that the line names, for example "KSTLib/KSTLib".
    const char* path;
};

/// Writes the line of a failed check and hands `status` back:
///
///     <tag>: AssertMacros: <condition> (value: 0x<value>),  file: <path>:<line>
///
/// `value` is shown as 64 bits in hexadecimal, so -5 is 0xfffffffffffffffb. `line` is the caller's
/// unless it is given.
KSTStatus fail(const AssertionContext& context, const char* condition, std::int64_t value,
               KSTStatus status, int line = __builtin_LINE()) noexcept;

/// `fail` for a call that returned `status`, which must be 0 and is not.
inline KSTStatus failCall(const AssertionContext& context, KSTStatus status,
                          int line = __builtin_LINE()) noexcept {
    return fail(context, "err == 0 ", status, status, line);
}

/// Writes the line of a failed check and stops the process: a program that has come here is broken.
[[noreturn]] void stop(const AssertionContext& context, const char* condition,
                       int line = __builtin_LINE()) noexcept;

} // namespace kst
