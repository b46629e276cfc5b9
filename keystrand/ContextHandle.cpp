#include "keystrand/ContextHandle.h"

#include "base/Digits.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <sys/random.h>

namespace keystrand {

std::optional<KSTHandle> randomHandle() {
    KSTHandle handle{};
    ssize_t size = 0;
    do {
        size = ::getrandom(handle.bytes, sizeof handle.bytes, 0);
    } while (size < 0 && errno == EINTR);
    if (size != static_cast<ssize_t>(sizeof handle.bytes)) {
        return std::nullopt;
    }
    return handle;
}

bool isNoHandle(const KSTHandle& handle) {
    return std::all_of(std::begin(handle.bytes), std::end(handle.bytes),
                       [](auto byte) { return byte == 0; });
}

std::string toHex(const KSTHandle& handle) {
    return base::hexDigits(handle.bytes);
}

bool HandleOrder::operator()(const KSTHandle& left, const KSTHandle& right) const {
    return std::memcmp(left.bytes, right.bytes, sizeof left.bytes) < 0;
}

} // namespace keystrand
