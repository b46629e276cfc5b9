#include "kstd/Analytics/SQLite/SchemaHash.h"

#include "kstd/Analytics/SQLite/HexText.h"

#include <array>
#include <cstdint>
#include <openssl/evp.h>
#include <stdexcept>

namespace kstd {

std::string schemaHash(std::string_view schema) {
    constexpr std::size_t kSHA256Size = 32;
    std::array<std::uint8_t, kSHA256Size> digest{};
    if (EVP_Digest(schema.data(), schema.size(), digest.data(), nullptr, EVP_sha256(), nullptr) !=
        1) {
        throw std::runtime_error("libcrypto offers no SHA-256");
    }
    return RXUppercaseHexStringWithoutSpaces(digest);
}

} // namespace kstd
