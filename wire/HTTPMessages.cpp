#include "wire/HTTPMessages.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <algorithm>

namespace wire {

namespace {

constexpr std::uint8_t kYes = 1;

/// The least and the most that follows the header of a message.
struct SizeRange {
    std::size_t least;
    std::size_t most;
};

std::optional<SizeRange> sizesOf(HTTPMessageType type) {
    switch (type) {
    case HTTPMessageType::request:
        return SizeRange{kHTTPRequestFixedSize + 2, kHTTPMaxFieldsSize};
    case HTTPMessageType::verdict:
        return SizeRange{1, 1};
    case HTTPMessageType::piece:
        return SizeRange{1, kHTTPMaxPieceSize};
    case HTTPMessageType::challenge:
        return SizeRange{kHTTPChallengeFixedSize + 1, kHTTPChallengeFixedSize +
                                                          kHTTPMaxChallengeMethodLength +
                                                          kHTTPMaxHostLength};
    case HTTPMessageType::bodyWanted:
        return SizeRange{4, 4};
    case HTTPMessageType::working:
        return SizeRange{0, 0};
    case HTTPMessageType::failure:
        return SizeRange{kHTTPFailureFixedSize + 1,
                         kHTTPFailureFixedSize + kHTTPMaxDomainLength + kHTTPMaxDescriptionLength};
    case HTTPMessageType::response:
        return SizeRange{kHTTPResponseFixedSize, kHTTPResponseFixedSize + kHTTPMaxClassNameLength};
    }
    return std::nullopt;
}

/// A text without control characters, of a length in that range.
bool isLine(std::string_view text, std::size_t least, std::size_t most) {
    return text.size() >= least && text.size() <= most &&
           std::none_of(text.begin(), text.end(), [](char c) {
               const auto byte = static_cast<unsigned char>(c);
               return byte < 0x20 || byte == 0x7f;
           });
}

bool isHeader(const std::pair<std::string_view, std::string_view>& header) {
    return isLine(header.first, 1, kHTTPMaxHeaderNameLength) &&
           isLine(header.second, 0, kHTTPMaxHeaderValueLength);
}

bool isValid(const HTTPRequestFields& fields) {
    return isLine(fields.method, 1, kHTTPMaxMethodLength) &&
           isLine(fields.link, 1, kHTTPMaxLinkLength) && fields.bodySize <= kHTTPMaxBodySize &&
           fields.maximumAnswerSize <= kHTTPMaxBodySize &&
           fields.headers.size() <= kHTTPMaxHeaders &&
           std::all_of(fields.headers.begin(), fields.headers.end(), isHeader);
}

bool isValid(const HTTPChallengeFields& fields) {
    return isLine(fields.method, 1, kHTTPMaxChallengeMethodLength) &&
           isLine(fields.host, 0, kHTTPMaxHostLength);
}

bool isValid(const HTTPFailureFields& fields) {
    return isLine(fields.domain, 1, kHTTPMaxDomainLength) &&
           isLine(fields.description, 0, kHTTPMaxDescriptionLength);
}

bool isValid(const HTTPResponseFields& fields) {
    return fields.bodySize <= kHTTPMaxBodySize &&
           isLine(fields.className, 0, kHTTPMaxClassNameLength);
}

std::size_t sizeOf(const HTTPRequestFields& fields) {
    std::size_t size = kHTTPRequestFixedSize + fields.method.size() + fields.link.size();
    for (const auto& [name, value] : fields.headers) {
        size += kHTTPRequestHeaderFixedSize + name.size() + value.size();
    }
    return size;
}

bool writeFields(base::ByteWriter& writer, const HTTPRequestFields& fields) {
    return writer.writeU8(fields.hasDelegate ? kYes : 0) &&
           writer.writeU8(static_cast<std::uint8_t>(fields.method.size())) &&
           writer.writeU16(static_cast<std::uint16_t>(fields.headers.size())) &&
           writer.writeU32(static_cast<std::uint32_t>(fields.link.size())) &&
           writer.writeU64(fields.bodySize) && writer.writeU64(fields.maximumAnswerSize) &&
           writer.writeText(fields.method) && writer.writeText(fields.link) &&
           std::all_of(fields.headers.begin(), fields.headers.end(), [&](const auto& header) {
               return writer.writeU8(static_cast<std::uint8_t>(header.first.size())) &&
                      writer.writeU16(static_cast<std::uint16_t>(header.second.size())) &&
                      writer.writeText(header.first) && writer.writeText(header.second);
           });
}

bool writeFields(base::ByteWriter& writer, const HTTPChallengeFields& fields) {
    return writer.writeU8(static_cast<std::uint8_t>(fields.method.size())) &&
           writer.writeU8(static_cast<std::uint8_t>(fields.host.size())) &&
           writer.writeU32(fields.previousFailureCount) && writer.writeU32(fields.evaluation) &&
           writer.writeText(fields.method) && writer.writeText(fields.host);
}

bool writeFields(base::ByteWriter& writer, const HTTPFailureFields& fields) {
    return writer.writeU64(static_cast<std::uint64_t>(fields.code)) &&
           writer.writeU8(static_cast<std::uint8_t>(fields.domain.size())) &&
           writer.writeU16(static_cast<std::uint16_t>(fields.description.size())) &&
           writer.writeText(fields.domain) && writer.writeText(fields.description);
}

bool writeFields(base::ByteWriter& writer, const HTTPResponseFields& fields) {
    return writer.writeU8(fields.status ? kYes : 0) &&
           writer.writeU32(static_cast<std::uint32_t>(fields.status.value_or(0))) &&
           writer.writeU64(fields.bodySize) &&
           writer.writeU8(static_cast<std::uint8_t>(fields.className.size())) &&
           writer.writeText(fields.className);
}

/// A message whose fields are to be written behind its header.
HTTPMessageBytes beginMessage(HTTPMessageType type, std::size_t size) {
    const auto header = encodeHTTPHeader({type, static_cast<std::uint32_t>(size)});
    HTTPMessageBytes message(header.begin(), header.end());
    message.resize(kHTTPHeaderSize + size);
    return message;
}

base::ByteWriter fieldsOf(HTTPMessageBytes& message) {
    return base::ByteWriter(std::span(message).subspan(kHTTPHeaderSize));
}

template <typename Fields>
std::optional<HTTPMessageBytes> encode(HTTPMessageType type, const Fields& fields,
                                       std::size_t size) {
    if (!isValid(fields) || size > kHTTPMaxFieldsSize) {
        return std::nullopt;
    }
    HTTPMessageBytes message = beginMessage(type, size);
    base::ByteWriter writer = fieldsOf(message);
    return writeFields(writer, fields) ? std::optional(std::move(message)) : std::nullopt;
}

bool readFlag(base::ByteReader& reader, bool& flag) {
    std::uint8_t value = 0;
    if (!reader.readU8(value) || value > kYes) {
        return false;
    }
    flag = value == kYes;
    return true;
}

bool readRequestHeader(base::ByteReader& reader,
                       std::pair<std::string_view, std::string_view>& header) {
    std::uint8_t nameLength = 0;
    std::uint16_t valueLength = 0;
    return reader.readU8(nameLength) && reader.readU16(valueLength) &&
           reader.readText(header.first, nameLength) && reader.readText(header.second, valueLength);
}

bool readRequestHeaders(base::ByteReader& reader, std::size_t count, HTTPRequestFields& fields) {
    if (count > kHTTPMaxHeaders) {
        return false;
    }
    fields.headers.resize(count);
    return std::all_of(fields.headers.begin(), fields.headers.end(),
                       [&](auto& header) { return readRequestHeader(reader, header); }) &&
           reader.left() == 0;
}

} // namespace

HTTPHeaderBytes encodeHTTPHeader(const HTTPHeader& header) {
    HTTPHeaderBytes bytes{};
    base::ByteWriter writer(bytes);
    static_cast<void>(writer.writeText({kHTTPMagic, sizeof kHTTPMagic}) &&
                      writer.writeU8(kHTTPVersion) &&
                      writer.writeU8(static_cast<std::uint8_t>(header.type)) &&
                      writer.writeU16(0) && writer.writeU32(header.size));
    return bytes;
}

std::optional<HTTPHeader> decodeHTTPHeader(std::span<const std::uint8_t, kHTTPHeaderSize> bytes) {
    base::ByteReader reader(bytes);
    std::string_view magic;
    std::uint8_t version = 0;
    std::uint8_t type = 0;
    std::uint16_t reserved = 0;
    HTTPHeader header;
    // There are as many bytes as a header has.
    static_cast<void>(reader.readText(magic, sizeof kHTTPMagic));
    static_cast<void>(reader.readU8(version));
    static_cast<void>(reader.readU8(type));
    static_cast<void>(reader.readU16(reserved));
    static_cast<void>(reader.readU32(header.size));
    if (magic != std::string_view(kHTTPMagic, sizeof kHTTPMagic) || version != kHTTPVersion ||
        reserved != 0) {
        return std::nullopt;
    }
    header.type = static_cast<HTTPMessageType>(type);
    const auto sizes = sizesOf(header.type);
    if (!sizes || header.size < sizes->least || header.size > sizes->most) {
        return std::nullopt;
    }
    return header;
}

std::optional<HTTPMessageBytes> encodeHTTPRequest(const HTTPRequestFields& fields) {
    return encode(HTTPMessageType::request, fields, sizeOf(fields));
}

std::optional<HTTPMessageBytes> encodeHTTPChallenge(const HTTPChallengeFields& fields) {
    return encode(HTTPMessageType::challenge, fields,
                  kHTTPChallengeFixedSize + fields.method.size() + fields.host.size());
}

HTTPMessageBytes encodeHTTPVerdict(HTTPVerdict verdict) {
    HTTPMessageBytes message = beginMessage(HTTPMessageType::verdict, 1);
    message.back() = static_cast<std::uint8_t>(verdict);
    return message;
}

HTTPMessageBytes encodeHTTPBodyWanted(std::uint32_t most) {
    HTTPMessageBytes message = beginMessage(HTTPMessageType::bodyWanted, sizeof most);
    static_cast<void>(fieldsOf(message).writeU32(most));
    return message;
}

HTTPMessageBytes encodeHTTPWorking() {
    return beginMessage(HTTPMessageType::working, 0);
}

std::optional<HTTPMessageBytes> encodeHTTPFailure(const HTTPFailureFields& fields) {
    return encode(HTTPMessageType::failure, fields,
                  kHTTPFailureFixedSize + fields.domain.size() + fields.description.size());
}

std::optional<HTTPMessageBytes> encodeHTTPResponse(const HTTPResponseFields& fields) {
    return encode(HTTPMessageType::response, fields,
                  kHTTPResponseFixedSize + fields.className.size());
}

std::optional<HTTPRequestFields> decodeHTTPRequest(std::span<const std::uint8_t> fields) {
    base::ByteReader reader(fields);
    HTTPRequestFields request;
    std::uint8_t methodLength = 0;
    std::uint16_t headerCount = 0;
    std::uint32_t linkLength = 0;
    if (fields.size() > kHTTPMaxFieldsSize || !readFlag(reader, request.hasDelegate) ||
        !reader.readU8(methodLength) || !reader.readU16(headerCount) ||
        !reader.readU32(linkLength) || !reader.readU64(request.bodySize) ||
        !reader.readU64(request.maximumAnswerSize) ||
        !reader.readText(request.method, methodLength) ||
        !reader.readText(request.link, linkLength) ||
        !readRequestHeaders(reader, headerCount, request) || !isValid(request)) {
        return std::nullopt;
    }
    return request;
}

std::optional<HTTPChallengeFields> decodeHTTPChallenge(std::span<const std::uint8_t> fields) {
    base::ByteReader reader(fields);
    HTTPChallengeFields challenge;
    std::uint8_t methodLength = 0;
    std::uint8_t hostLength = 0;
    if (!reader.readU8(methodLength) || !reader.readU8(hostLength) ||
        !reader.readU32(challenge.previousFailureCount) || !reader.readU32(challenge.evaluation) ||
        !reader.readText(challenge.method, methodLength) ||
        !reader.readText(challenge.host, hostLength) || reader.left() != 0 || !isValid(challenge)) {
        return std::nullopt;
    }
    return challenge;
}

std::optional<HTTPVerdict> decodeHTTPVerdict(std::span<const std::uint8_t> fields) {
    if (fields.size() != 1 || fields[0] < static_cast<std::uint8_t>(HTTPVerdict::accept) ||
        fields[0] > static_cast<std::uint8_t>(HTTPVerdict::refuse)) {
        return std::nullopt;
    }
    return static_cast<HTTPVerdict>(fields[0]);
}

std::optional<std::uint32_t> decodeHTTPBodyWanted(std::span<const std::uint8_t> fields) {
    base::ByteReader reader(fields);
    std::uint32_t most = 0;
    if (!reader.readU32(most) || reader.left() != 0 || most == 0) {
        return std::nullopt;
    }
    return most;
}

std::optional<HTTPFailureFields> decodeHTTPFailure(std::span<const std::uint8_t> fields) {
    base::ByteReader reader(fields);
    HTTPFailureFields failure;
    std::uint64_t code = 0;
    std::uint8_t domainLength = 0;
    std::uint16_t descriptionLength = 0;
    if (!reader.readU64(code) || !reader.readU8(domainLength) ||
        !reader.readU16(descriptionLength) || !reader.readText(failure.domain, domainLength) ||
        !reader.readText(failure.description, descriptionLength) || reader.left() != 0 ||
        !isValid(failure)) {
        return std::nullopt;
    }
    failure.code = static_cast<std::int64_t>(code);
    return failure;
}

std::optional<HTTPResponseFields> decodeHTTPResponse(std::span<const std::uint8_t> fields) {
    base::ByteReader reader(fields);
    HTTPResponseFields response;
    bool hasStatus = false;
    std::uint32_t status = 0;
    std::uint8_t classNameLength = 0;
    if (!readFlag(reader, hasStatus) || !reader.readU32(status) ||
        !reader.readU64(response.bodySize) || !reader.readU8(classNameLength) ||
        !reader.readText(response.className, classNameLength) || reader.left() != 0 ||
        (!hasStatus && status != 0) || !isValid(response)) {
        return std::nullopt;
    }
    if (hasStatus) {
        response.status = static_cast<std::int32_t>(status);
    }
    return response;
}

} // namespace wire
