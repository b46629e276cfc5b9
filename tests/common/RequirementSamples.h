#pragma once

#include "KSTLib/Requirement.h"
#include "tests/common/SerializationFixture.h"

#include <cstring>

namespace support {

inline Bytes requirementHeader(std::uint32_t type, std::uint32_t dataLength) {
    Bytes bytes(16);
    putU32(bytes, 0, type);
    putU32(bytes, 4, 0x04040404);
    putU32(bytes, 8, 0x08080808);
    putU32(bytes, 12, dataLength);
    return bytes;
}

/// On the wire, the data counting up.
inline Bytes leafBytes(std::uint32_t type, std::uint32_t dataLength = 0) {
    Bytes bytes = requirementHeader(type, dataLength);
    for (std::uint32_t i = 0; i < dataLength; ++i) {
        bytes.push_back(static_cast<std::uint8_t>(i));
    }
    return bytes;
}

/// A composite on the wire; `count` may lie.
inline Bytes compositeBytes(std::uint32_t type, std::uint32_t count,
                            const std::vector<Bytes>& children) {
    const bool isKofN = type == 7;
    Bytes bytes = requirementHeader(type, (isKofN ? 8 : 4) + 8 * count);
    bytes.resize(isKofN ? 24 : 20);
    if (isKofN) {
        putU32(bytes, 16, 0x10101010);
    }
    putU32(bytes, bytes.size() - 4, count);
    for (const Bytes& child : children) {
        append(bytes, child);
    }
    return bytes;
}

inline Bytes compositeBytes(std::uint32_t type, const std::vector<Bytes>& children) {
    return compositeBytes(type, static_cast<std::uint32_t>(children.size()), children);
}

inline KSTRequirement* asRequirement(Bytes& bytes) {
    return reinterpret_cast<KSTRequirement*>(bytes.data());
}

/// A composite in memory, which the caller owns.
inline Bytes compositeInMemory(std::uint32_t type, const std::vector<KSTRequirement*>& children) {
    Bytes bytes = compositeBytes(type, static_cast<std::uint32_t>(children.size()), {});
    const std::size_t prefix = bytes.size();
    bytes.resize(prefix + children.size() * sizeof(void*));
    if (!children.empty()) {
        std::memcpy(&bytes[prefix], children.data(), children.size() * sizeof(void*));
    }
    return bytes;
}

inline constexpr std::uint32_t kLeafTypes[] = {1, 2, 3, 6, 8, 9, 10, 11, 12, 13, 14, 15, 16};
inline constexpr std::uint32_t kCompositeTypes[] = {4, 5, 7};

} // namespace support
