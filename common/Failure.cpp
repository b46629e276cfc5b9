#include "common/Failure.h"

#include <cinttypes>
#include <cstdio>

namespace kst {

KSTStatus printReturn(const char* function, KSTStatus status) noexcept {
    if (status != kKSTErrorSuccess) {
        // There is nobody to tell when standard output cannot be written to.
        static_cast<void>(
            std::printf("%s: %s: returning, err = %" PRId32 ".\n", kLibCallTag, function, status));
        static_cast<void>(std::fflush(stdout));
    }
    return status;
}

} // namespace kst
