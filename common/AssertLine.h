#pragma once

#include "KSTLib/Status.h"
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

/// Writes the line of a failed check:
///
///     <tag>: AssertMacros: <condition> (value: 0x<value>),  file: <path>:<line>
///
/// `value` is shown as 64 bits in hexadecimal, so -5 is 0xfffffffffffffffb.
[[gnu::cold]] void writeAssertLine(platform::SystemLog* log, const char* tag, const char* path,
                                   int line, const char* condition, std::int64_t value) noexcept;

/// Writes that line for the caller's own, unless another is given, and hands `status` back. It
/// takes the context apart in its caller, so that one whose checks all hold never makes a context.
[[gnu::always_inline]] inline KSTStatus fail(const AssertionContext& context, const char* condition,
                                             std::int64_t value, KSTStatus status,
                                             int line = __builtin_LINE()) noexcept {
    writeAssertLine(context.log, context.tag, context.path, line, condition, value);
    return status;
}

/// `fail` for a call that returned `status`, which must be 0 and is not.
[[gnu::always_inline]] inline KSTStatus failCall(const AssertionContext& context, KSTStatus status,
                                                 int line = __builtin_LINE()) noexcept {
    return fail(context, "err == 0 ", status, status, line);
}

/// Writes the line of a failed check and stops the process: a program that has come here is broken.
[[noreturn]] void stop(const AssertionContext& context, const char* condition,
                       int line = __builtin_LINE()) noexcept;

} // namespace kst
