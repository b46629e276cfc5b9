#pragma once

#include "common/AssertLine.h"

#include <cstddef>
#include <utility>

namespace kst {

struct RequiredArgument {
    const void* value;
    /// What the line of the failed check calls it.
    const char* name;
};

/// kKSTErrorBadParameter, with the line of the first argument that is null; otherwise success. The
/// list of arguments is taken apart by the compiler and never stands in memory.
template <std::size_t count>
[[nodiscard]] inline KSTStatus requireArguments(const AssertionContext& context,
                                                const RequiredArgument (&arguments)[count],
                                                int line = __builtin_LINE()) noexcept {
    const char* missing = nullptr;
    const auto isThere = [&missing](const RequiredArgument& argument) {
        missing = argument.name;
        return argument.value != nullptr;
    };
    const auto areThere = [&]<std::size_t... index>(std::index_sequence<index...>) {
        return (isThere(arguments[index]) && ...);
    };
    const bool complete = areThere(std::make_index_sequence<count>{});
    return complete ? kKSTErrorSuccess : fail(context, missing, 0, kKSTErrorBadParameter, line);
}

} // namespace kst
