#pragma once

#include "KSTLib/Contexts.h"
#include "base/ByteReader.h"
#include "base/ByteWriter.h"

namespace kst {

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
