#pragma once

#include "KSTLib/Contexts.h"
#include "base/ByteReader.h"
#include "base/ByteWriter.h"
#include "common/Allocation.h"

#include <cstring>

/// What a KSTContextRef points to: the handle and, in memory that came from KSTContextCreate, one
/// byte more behind it, which nobody reads again.
struct KSTContext {
    KSTHandle handle;
};

namespace kst {

static_assert(sizeof(KSTContext) == kKSTHandleSize);

/// Null for null.
[[nodiscard]] inline const KSTHandle* handleOf(const KSTContext* context) noexcept {
    return context != nullptr ? &context->handle : nullptr;
}

/// Allocates a context of the 16 bytes at `handle`. Null when there is no memory.
[[nodiscard]] inline KSTContext* makeContext(const void* handle) noexcept {
    auto* context = static_cast<KSTContext*>(allocate(sizeof(KSTContext)));
    if (context != nullptr) {
        std::memcpy(context->handle.bytes, handle, kKSTHandleSize);
    }
    return context;
}

/// Wipes and frees a context and subtracts 16 bytes from the account, also where KSTContextCreate
/// added 17.
inline void disposeOfContext(KSTContext* context) noexcept {
    release(context, sizeof(KSTContext));
}

/// Writes 16 zero bytes for null. False when they do not fit.
[[nodiscard]] inline bool writeHandle(base::ByteWriter& writer, const KSTHandle* handle) noexcept {
    const KSTHandle absent{};
    return writer.writeBytes(handle != nullptr ? handle->bytes : absent.bytes, kKSTHandleSize);
}

/// False, with `handle` as it was, when the bytes are not there.
[[nodiscard]] inline bool readHandle(base::ByteReader& reader, KSTHandle& handle) noexcept {
    return reader.readBytes(handle.bytes, kKSTHandleSize);
}

} // namespace kst
