#pragma once

#include <cstddef>
#include <functional>

namespace bench {

/// Runs `work` on a thread of its own with a stack of `size` bytes, behind which nothing can be
/// touched, and passes on what it throws. Throws when there is no such thread.
void runOnStackOf(std::size_t size, const std::function<void()>& work);

} // namespace bench
