// Feeds the decoders of the messages between the daemon and the HTTPS client: what one of them
// takes is within its limits and is encoded to the very same bytes.

#include "wire/HTTPMessages.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>

namespace {

using Bytes = std::span<const std::uint8_t>;

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

void requireEncoding(const std::optional<wire::HTTPMessageBytes>& message, Bytes fields) {
    require(message.has_value());
    require(std::ranges::equal(Bytes(*message).subspan(wire::kHTTPHeaderSize), fields));
    const auto header = wire::decodeHTTPHeader(Bytes(*message).first<wire::kHTTPHeaderSize>());
    require(header && header->size == fields.size());
}

template <typename Decode, typename Encode>
void check(Bytes fields, Decode decode, Encode encode) {
    if (const auto decoded = decode(fields)) {
        requireEncoding(encode(*decoded), fields);
    }
}

void checkFields(Bytes fields) {
    check(fields, wire::decodeHTTPRequest, wire::encodeHTTPRequest);
    check(fields, wire::decodeHTTPChallenge, wire::encodeHTTPChallenge);
    check(fields, wire::decodeHTTPVerdict, wire::encodeHTTPVerdict);
    check(fields, wire::decodeHTTPBodyWanted, wire::encodeHTTPBodyWanted);
    check(fields, wire::decodeHTTPFailure, wire::encodeHTTPFailure);
    check(fields, wire::decodeHTTPResponse, wire::encodeHTTPResponse);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const std::uint8_t kNothing = 0;
    const Bytes input(size > 0 ? data : &kNothing, size);
    checkFields(input);
    if (size >= wire::kHTTPHeaderSize) {
        const auto start = input.first<wire::kHTTPHeaderSize>();
        if (const auto header = wire::decodeHTTPHeader(start)) {
            require(header->size <= wire::kHTTPMaxFieldsSize);
            require(std::ranges::equal(wire::encodeHTTPHeader(*header), start));
        }
        checkFields(input.subspan(wire::kHTTPHeaderSize));
    }
    return 0;
}
