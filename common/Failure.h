#pragma once

#include "KSTLib/Status.h"
#include "common/LibraryLog.h"
#include "platform/SystemLog.h"

#include <cstddef>
#include <cstdint>
#include <utility>

/// How a function of the library or of a program tells what it refuses and what went wrong: one
/// line for each failed check, and the status back, so that both are one statement:
///
///     KSTStatus err = context.requireArguments({Argument(a, "a"), Argument(b, "b")});
///     if (size > room) return fail(context, "size <= room", 0, kKSTErrorBadParameter);
///     if (err != kKSTErrorSuccess) return failCall(context, err);
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
        : isThere(argument != nullptr), name(argumentName), place(argumentPlace) {}

    template <typename Result, typename... Arguments>
    explicit constexpr Argument(Result (*function)(Arguments...), const char* argumentName,
                                CheckPlace argumentPlace = CheckPlace::here()) noexcept
        : isThere(function != nullptr), name(argumentName), place(argumentPlace) {}

    /// A block, which has no address of its own: what it calls stands for it.
    template <typename Block>
    requires requires(const Block& block) { block.invoke; }
    explicit constexpr Argument(const Block& block, const char* argumentName,
                                CheckPlace argumentPlace = CheckPlace::here()) noexcept
        : isThere(block.invoke != nullptr), name(argumentName), place(argumentPlace) {}

    bool isThere;
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
        return argument.isThere;
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

/// The context of the library's failed checks: its log.
[[nodiscard]] inline AssertionContext libraryContext() noexcept {
    return {libraryLog(), "KSTLib", "KSTLib/KSTLib"};
}

inline constexpr const char* kLibCallTag = "KST";

/// The context of a failed check in a LibCall function of the source `path`: the library's log.
[[nodiscard]] inline AssertionContext libCallContext(const char* path) noexcept {
    return {libraryLog(), kLibCallTag, path};
}

/// The context of a failed check in the serialisers.
[[nodiscard]] inline AssertionContext serializationContext() noexcept {
    return libCallContext("common/LibSerialization");
}

/// The failure of a writer whose payload does not fit.
[[nodiscard]] inline KSTStatus failForRoom(CheckPlace place = CheckPlace::here()) noexcept {
    return fail(serializationContext(), "*outSize >= requiredSize", 0, kKSTErrorBadParameter,
                place);
}

/// `measured` is how measuring the payload ended: a failure is reported and returned. Otherwise the
/// size must fit.
[[nodiscard]] inline KSTStatus checkRoom(KSTStatus measured, std::uint64_t requiredSize,
                                         std::uint64_t room) noexcept {
    if (measured != kKSTErrorSuccess) {
        return failCall(serializationContext(), measured);
    }
    return room >= requiredSize ? kKSTErrorSuccess : failForRoom();
}

/// Writes the line "err == 0 " once for each of `levels` levels that a failure passes on its way
/// up. Hands `status` back.
inline KSTStatus failLevels(const AssertionContext& context, KSTStatus status,
                            std::size_t levels) noexcept {
    for (std::size_t level = 0; level < levels; ++level) {
        static_cast<void>(failCall(context, status));
    }
    return status;
}

/// Prints the line of a LibCall function's failed return to standard output and flushes it, so that
/// it is not lost with the process; prints nothing on success. Hands `status` back.
KSTStatus printReturn(const char* function, KSTStatus status) noexcept;

} // namespace kst
