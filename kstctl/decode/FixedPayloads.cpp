// The payloads that are a handle and numbers, or less. The library writes them field by field where
// it sends them and reads none, so they are read here.

#include "base/ByteReader.h"
#include "base/Concat.h"
#include "common/HandleWire.h"
#include "kstctl/decode/CredentialFields.h"
#include "kstctl/decode/Payloads.h"
#include "kstctl/decode/ScopeText.h"

#include <string>

namespace kstctl::decode {

namespace {

platform::Error tooShort(std::size_t wanted, std::size_t given) {
    return malformed(base::concat("the payload has ", wanted, " bytes, not ", given));
}

struct HandleAndNumbers {
    KSTHandle handle{};
    std::uint32_t first = 0;
    std::uint32_t second = 0;

    static constexpr std::size_t kSize = kKSTHandleSize + 4 + 4;
};

std::optional<HandleAndNumbers> read(Bytes bytes) {
    HandleAndNumbers payload;
    base::ByteReader reader(bytes);
    if (!kst::readHandle(reader, payload.handle) || !reader.readU32(payload.first) ||
        !reader.readU32(payload.second)) {
        return std::nullopt;
    }
    return payload;
}

/// The second number is a scope in the commands that remove, and the kernel service's own in those
/// that ask.
enum class Second { scope, argument };

Result decodeNumbers(Bytes bytes, const char* firstName, bool isType, Second second) {
    const auto payload = read(bytes);
    if (!payload) {
        return tooShort(HandleAndNumbers::kSize, bytes.size());
    }
    Decoded decoded{.fields = {}, .size = HandleAndNumbers::kSize};
    decoded.fields.add("handle", hexText(payload->handle.bytes))
        .add(firstName, payload->first, isType ? credentialTypeText(payload->first) : "");
    if (second == Second::scope) {
        decoded.fields.add("scope", payload->second, scopeText(payload->second));
    } else {
        decoded.fields.add("argument", payload->second);
    }
    return decoded;
}

} // namespace

Result decodeNoPayload(Bytes /*bytes*/, Secrets /*secrets*/) {
    return Decoded{};
}

Result decodeHandle(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    if (base::ByteReader reader(bytes); !kst::readHandle(reader, handle)) {
        return tooShort(kKSTHandleSize, bytes.size());
    }
    Decoded decoded{.fields = {}, .size = kKSTHandleSize};
    decoded.fields.add("handle", hexText(handle.bytes));
    return decoded;
}

Result decodeContainsCredentialType(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "type", true, Second::argument);
}

Result decodeRemoveCredentialsByType(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "type", true, Second::scope);
}

Result decodeContainsPassphrase(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "purpose", false, Second::argument);
}

Result decodeRemovePassphrases(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "purpose", false, Second::scope);
}

} // namespace kstctl::decode
