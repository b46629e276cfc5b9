#pragma once

#include "KSTLib/Status.h"
#include "platform/SystemLog.h"

#include <cstddef>
#include <cstdint>
#include <utility>

namespace kst {

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

/// An argument that must not be null. Each stands on a line of its own, which is its check's.
struct Argument {
    explicit constexpr Argument(const void* argument, const char* argumentName,
                                CheckPlace argumentPlace = CheckPlace::here()) noexcept
        : value(argument), name(argumentName), place(argumentPlace) {}

    const void* value;
    /// What the line of the failed check calls it.
    const char* name;
    CheckPlace place;
};

/// Who reports a failed check, and where to.
struct AssertionContext {
    /// Null: nothing is written.
    platform::SystemLog* log;
    /// Begins the line, for example "KSTLib".
    const char* tag;
    /// The path that the line names, for example "KSTLib/KSTLib": what the check belongs to.
    const char* path;

    /// kKSTErrorBadParameter, with the line of the first argument that is null; otherwise success.
    /// The list is taken apart by the compiler and never stands in memory.
    template <std::size_t count>
    [[nodiscard]] KSTStatus requireArguments(const Argument (&arguments)[count]) const noexcept;
};

/// Writes the line of a failed check:
///
///     <tag>: AssertMacros: <condition> (value: 0x<value>),  file: <path>:<line>
///
/// `value` is shown as 64 bits in hexadecimal, so -5 is 0xfffffffffffffffb. The line is that of
/// `place`, which the log gets whole as the line's place in the code: several sources may have one
/// path.
[[gnu::cold]] void writeAssertLine(platform::SystemLog* log, const char* tag, const char* path,
                                   const CheckPlace& place, const char* condition,
                                   std::int64_t value) noexcept;

/// Writes that line for the caller's place, unless another is given, and hands `status` back. It
/// takes the context apart in its caller, so that one whose checks all hold never makes a context.
[[gnu::always_inline]] inline KSTStatus fail(const AssertionContext& context, const char* condition,
                                             std::int64_t value, KSTStatus status,
                                             CheckPlace place = CheckPlace::here()) noexcept {
    writeAssertLine(context.log, context.tag, context.path, place, condition, value);
    return status;
}

template <std::size_t count>
[[gnu::always_inline]] inline KSTStatus
AssertionContext::requireArguments(const Argument (&arguments)[count]) const noexcept {
    const char* missing = nullptr;
    CheckPlace place{};
    const auto isThere = [&missing, &place](const Argument& argument) {
        missing = argument.name;
        place = argument.place;
        return argument.value != nullptr;
    };
    const auto areThere = [&]<std::size_t... index>(std::index_sequence<index...>) {
        return (isThere(arguments[index]) && ...);
    };
    const bool complete = areThere(std::make_index_sequence<count>{});
    return complete ? kKSTErrorSuccess : fail(*this, missing, 0, kKSTErrorBadParameter, place);
}

/// `fail` for a call that returned `status`, which must be 0 and is not.
[[gnu::always_inline]] inline KSTStatus failCall(const AssertionContext& context, KSTStatus status,
                                                 CheckPlace place = CheckPlace::here()) noexcept {
    return fail(context, "err == 0 ", status, status, place);
}

/// Writes the line of a failed check and stops the process: a program that has come here is broken.
[[noreturn]] void stop(const AssertionContext& context, const char* condition,
                       CheckPlace place = CheckPlace::here()) noexcept;

} // namespace kst
