#pragma once

#include "common/LibCallReport.h"

namespace kst {

/// The context of a failed check in the serialisers.
[[nodiscard]] inline AssertionContext serializationContext() noexcept {
    return libCallContext("common/LibSerialization");
}

} // namespace kst
