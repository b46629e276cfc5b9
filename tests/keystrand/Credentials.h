#pragma once

#include "KSTLib/CredentialSerialization.h"
#include "keystrand/CredentialSet.h"
#include "tests/keystrand/Bytes.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string_view>

namespace keystrand::test {

inline constexpr std::uint32_t kNoUser = 0xffffffff;

/// A credential, written out field by field.
inline ByteVector credential(std::uint32_t type, const ByteVector& data,
                             std::uint32_t user = kNoUser) {
    return Bytes().u32(type).u32(1).u32(0).u32(user).u64(0).u32(0).u32(data.size()).bytes(data);
}

/// The bytes of data that a type of credential has.
inline std::size_t dataSize(std::uint32_t type) {
    constexpr std::size_t kSizes[] = {0, 28, 136, 88, 0, 0, 0, 56, 0, 24, 36, 0, 8};
    return kSizes[type];
}

/// A credential whose data are filled with one byte.
inline ByteVector plainCredential(std::uint32_t type, std::uint32_t user = kNoUser,
                                  std::uint8_t fill = 0) {
    return credential(type, ByteVector(dataSize(type), fill), user);
}

inline ByteVector passphrase(std::string_view text, std::uint32_t purpose = 0,
                             std::uint32_t user = kNoUser) {
    return credential(
        2, Bytes().u32(purpose).u32(text.size()).text(text).fill(128 - text.size(), 0), user);
}

inline CredentialPointer read(const ByteVector& bytes) {
    KSTCredential* made = nullptr;
    std::size_t consumed = 0;
    EXPECT_EQ(DeserializeCredential(bytes.data(), bytes.size(), &made, &consumed), 0);
    return CredentialPointer(made);
}

} // namespace keystrand::test
