#pragma once

#include "KSTLib/Contexts.h"

/// What a KSTContextRef points to: the handle and, in memory that came from KSTContextCreate, one
/// byte more behind it, which nobody reads again.
struct KSTContext {
    KSTHandle handle;
};

namespace kst {

/// Null for null.
[[nodiscard]] inline const KSTHandle* handleOf(const KSTContext* context) noexcept {
    return context != nullptr ? &context->handle : nullptr;
}

/// Allocates a context of the 16 bytes at `handle`. Null when there is no memory.
[[nodiscard]] KSTContext* makeContext(const void* handle) noexcept;

/// Wipes and frees a context and subtracts 16 bytes from the account, also where KSTContextCreate
/// added 17.
void disposeOfContext(KSTContext* context) noexcept;

} // namespace kst
