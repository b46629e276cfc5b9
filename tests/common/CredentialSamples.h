#pragma once

#include "KSTLib/Credential.h"
#include "tests/common/SerializationFixture.h"

#include <array>

namespace support {

/// By type, from 1.
inline constexpr std::array<std::uint32_t, 12> kCredentialDataSizes = {28, 136, 88, 0,  0, 0,
                                                                       56, 0,   24, 36, 0, 8};

inline constexpr std::array<std::uint32_t, 4> kTypesOutside = {0, 13, 0x80000000U, 0xffffffffU};

/// A credential of `type` on the wire; the bytes after the type and around the length count up.
inline Bytes credentialBytes(std::uint32_t type, std::uint32_t dataLength) {
    Bytes bytes(32 + std::size_t{dataLength});
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        bytes[i] = static_cast<std::uint8_t>(i);
    }
    putU32(bytes, 0, type);
    putU32(bytes, 28, dataLength);
    return bytes;
}

inline Bytes credentialBytes(std::uint32_t type) {
    return credentialBytes(type, kCredentialDataSizes.at(type - 1));
}

/// The record that the bytes are.
inline KSTCredential* asCredential(Bytes& bytes) {
    return reinterpret_cast<KSTCredential*>(bytes.data());
}

} // namespace support
