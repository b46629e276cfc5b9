#pragma once

#include "common/AssertLine.h"

/// `requireArguments` for what is to be called.
namespace kst {

template <typename Result, typename... Arguments>
[[nodiscard]] KSTStatus requireFunction(const AssertionContext& context,
                                        Result (*function)(Arguments...), const char* name,
                                        CheckPlace place = CheckPlace::here()) noexcept {
    return function != nullptr ? kKSTErrorSuccess
                               : fail(context, name, 0, kKSTErrorBadParameter, place);
}

/// A result block, which has no address of its own: what it calls stands for it.
template <typename Block>
[[nodiscard]] KSTStatus requireBlock(const AssertionContext& context, const Block& block,
                                     const char* name,
                                     CheckPlace place = CheckPlace::here()) noexcept {
    return requireFunction(context, block.invoke, name, place);
}

} // namespace kst
