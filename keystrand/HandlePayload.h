#pragma once

#include "KSTLib/Handle.h"
#include "base/ByteReader.h"

#include <cassert>
#include <cstdint>
#include <span>

namespace keystrand {

/// A payload that begins with the handle of a context. It has at least 16 bytes.
struct HandlePayload {
    explicit HandlePayload(std::span<const std::uint8_t> payload) : rest(payload) {
        [[maybe_unused]] const bool fits = rest.readBytes(handle.bytes, sizeof handle.bytes);
        assert(fits);
    }

    /// The next number; it is there.
    [[nodiscard]] std::uint32_t number() {
        std::uint32_t value = 0;
        [[maybe_unused]] const bool fits = rest.readU32(value);
        assert(fits);
        return value;
    }

    KSTHandle handle{};
    base::ByteReader rest;
};

} // namespace keystrand
