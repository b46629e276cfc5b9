#pragma once

#include "common/AssertLine.h"

#include <initializer_list>

namespace kst {

struct RequiredArgument {
    const void* value;
    /// What the line of the failed check calls it.
    const char* name;
};

/// kKSTErrorBadParameter, with the line of the first argument that is null; otherwise success.
[[nodiscard]] inline KSTStatus requireArguments(const AssertionContext& context,
                                                std::initializer_list<RequiredArgument> arguments,
                                                int line = __builtin_LINE()) noexcept {
    for (const RequiredArgument& argument : arguments) {
        if (argument.value == nullptr) {
            return fail(context, argument.name, 0, kKSTErrorBadParameter, line);
        }
    }
    return kKSTErrorSuccess;
}

} // namespace kst
