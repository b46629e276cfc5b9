#pragma once

#include "KSTLib/Status.h"
#include "platform/FailedCheck.h"

#include <cstddef>
#include <cstdint>
#include <utility>

/// What the library's functions say of what they refuse and of what went wrong, beside the two
/// verbs `fail` and `failCall`:
///
///     KSTStatus err = requireArguments(context, {Argument(a, "a"), Argument(b, "b")});
namespace kst {

using platform::AssertionContext;
using platform::CheckPlace;
using platform::fail;
using platform::failCall;

/// What `libraryLog` reads and `setLibraryLog` writes; of no use to anyone else.
inline platform::SystemLog* installedLibraryLog = nullptr;

/// Which log the library writes to: one for the process. Null while none is set. Not synchronised.
[[nodiscard]] inline platform::SystemLog* libraryLog() noexcept {
    return installedLibraryLog;
}

/// Makes `log` the library's, or none when it is null. It must outlive its use.
inline void setLibraryLog(platform::SystemLog* log) noexcept {
    installedLibraryLog = log;
}

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

/// kKSTErrorBadParameter, with the line of the first argument that is null; otherwise success. The
/// list is taken apart by the compiler and never stands in memory.
template <std::size_t count>
[[nodiscard, gnu::always_inline]] inline KSTStatus
requireArguments(const AssertionContext& context, const Argument (&arguments)[count]) noexcept {
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
    return complete ? kKSTErrorSuccess : fail(context, missing, 0, kKSTErrorBadParameter, place);
}

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
