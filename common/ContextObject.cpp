#include "common/ContextObject.h"

#include "common/Allocation.h"

#include <cstring>

namespace kst {

static_assert(sizeof(KSTContext) == kKSTHandleSize);

KSTContext* makeContext(const void* handle) noexcept {
    auto* context = static_cast<KSTContext*>(allocate(sizeof(KSTContext)));
    if (context != nullptr) {
        std::memcpy(context->handle.bytes, handle, kKSTHandleSize);
    }
    return context;
}

void disposeOfContext(KSTContext* context) noexcept {
    release(context, sizeof(KSTContext));
}

} // namespace kst
