#pragma once

#include "platform/SystemLog.h"

#include <cstddef>
#include <cstdint>

/// How a failed check is told: one line in the system log, and the status back, so that both are
/// one statement:
///
///     if (size > room) return fail(context, "size <= room", 0, kBadSize);
///     if (err != 0) return failCall(context, err);
namespace platform {

/// The source and the line that hold a check. No other check of that source has the line.
struct CheckPlace {
    const char* file;
    int line;

    /// As a default argument: where the function was called.
    [[nodiscard]] static constexpr CheckPlace here(const char* file = __builtin_FILE(),
                                                   int line = __builtin_LINE()) noexcept {
        return {file, line};
    }
};

/// Who reports a failed check, and where to.
struct AssertionContext {
    /// Null: nothing is written.
    SystemLog* log;
    /// Begins the line, for example "KSTLib".
    const char* tag;
    /// The path that the line names, for example "KSTLib/KSTLib": what the check belongs to.
    const char* path;
};

/// What a line has room for; a longer one is cut there and ends in "...".
inline constexpr std::size_t kMaxLogLineLength = 1023;

/// Writes one line, formatted as printf does, at level info. Writes nothing when `log` is null.
/// The line is built on the stack, so that a failure to allocate can be reported too.
[[gnu::format(printf, 3, 4)]] void writeLogLine(SystemLog* log, const LogFields& place,
                                                const char* format, ...) noexcept;

/// Writes the line of a failed check:
///
///     <tag>: AssertMacros: <condition> (value: 0x<value>),  file: <path>:<line>
///
/// `value` is shown as 64 bits in hexadecimal, so -5 is 0xfffffffffffffffb. The line is that of
/// `place`, which the log gets whole as the line's place in the code: several sources may have one
/// path.
[[gnu::cold]] void writeAssertLine(SystemLog* log, const char* tag, const char* path,
                                   const CheckPlace& place, const char* condition,
                                   std::int64_t value) noexcept;

/// Writes that line for the caller's place, unless another is given, and hands `status` back. It
/// takes the context apart in its caller, so that one whose checks all hold never makes a context.
[[gnu::always_inline]] inline std::int32_t fail(const AssertionContext& context,
                                                const char* condition, std::int64_t value,
                                                std::int32_t status,
                                                CheckPlace place = CheckPlace::here()) noexcept {
    writeAssertLine(context.log, context.tag, context.path, place, condition, value);
    return status;
}

/// `fail` for a call that returned `status`, which must be 0 and is not.
[[gnu::always_inline]] inline std::int32_t
failCall(const AssertionContext& context, std::int32_t status,
         CheckPlace place = CheckPlace::here()) noexcept {
    return fail(context, "err == 0 ", status, status, place);
}

/// Writes the line of a failed check and stops the process: a program that has come here is broken.
[[noreturn]] void stop(const AssertionContext& context, const char* condition,
                       CheckPlace place = CheckPlace::here()) noexcept;

} // namespace platform
