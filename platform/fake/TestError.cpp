#include "platform/fake/TestError.h"

#include <cstdio>
#include <cstdlib>

namespace platform {

void testError(std::string_view message) {
    std::fprintf(stderr, "error in the test: %.*s\n", static_cast<int>(message.size()),
                 message.data());
    std::abort();
}

} // namespace platform
