#include "wire/KernelSocket.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"
#include "base/Saturate.h"

#include <cassert>

namespace wire {

namespace {

constexpr std::string_view kRequestMagic{kKernelRequestMagic, sizeof kKernelRequestMagic};
constexpr std::string_view kReplyMagic{kKernelReplyMagic, sizeof kKernelReplyMagic};

void writeHead(base::ByteWriter& writer, std::string_view magic, KernelOperation operation,
               std::uint64_t sequence) {
    const bool fits = writer.writeText(magic) && writer.writeU8(kKernelSocketVersion) &&
                      writer.writeU8(static_cast<std::uint8_t>(operation)) && writer.writeU16(0) &&
                      writer.writeU64(sequence);
    assert(fits);
    static_cast<void>(fits);
}

bool readHead(base::ByteReader& reader, std::string_view expectedMagic, KernelOperation& operation,
              std::uint16_t& reserved, std::uint64_t& sequence) {
    std::string_view magic;
    std::uint8_t version = 0;
    std::uint8_t code = 0;
    if (!reader.readText(magic, expectedMagic.size()) || !reader.readU8(version) ||
        !reader.readU8(code) || !reader.readU16(reserved) || !reader.readU64(sequence)) {
        return false;
    }
    // Any code fits into the type; which ones there are is looked at below.
    operation = static_cast<KernelOperation>(code);
    return magic == expectedMagic && version == kKernelSocketVersion &&
           operation >= KernelOperation::findByPath && operation <= KernelOperation::scalarCall;
}

std::optional<std::string_view> wholeText(std::span<const std::uint8_t> bytes,
                                          std::size_t maxLength) {
    if (bytes.empty() || bytes.size() > maxLength) {
        return std::nullopt;
    }
    return std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size());
}

} // namespace

KernelRequestHeaderBytes encodeKernelRequestHeader(const KernelRequestHeader& header) {
    KernelRequestHeaderBytes bytes{};
    base::ByteWriter writer(bytes);
    writeHead(writer, kRequestMagic, header.operation, header.sequence);
    return bytes;
}

KernelReplyHeaderBytes encodeKernelReplyHeader(const KernelReplyHeader& header) {
    KernelReplyHeaderBytes bytes{};
    base::ByteWriter writer(bytes);
    writeHead(writer, kReplyMagic, header.operation, header.sequence);
    const bool fits = writer.writeU32(static_cast<std::uint32_t>(header.status)) &&
                      writer.writeU32(header.reported);
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

std::optional<KernelRequestHeader>
decodeKernelRequestHeader(std::span<const std::uint8_t> message) {
    base::ByteReader reader(message);
    KernelRequestHeader header;
    std::uint16_t reserved = 0;
    if (!readHead(reader, kRequestMagic, header.operation, reserved, header.sequence) ||
        reserved != 0) {
        return std::nullopt;
    }
    return header;
}

std::optional<KernelReplyHeader> decodeKernelReplyHeader(std::span<const std::uint8_t> message) {
    base::ByteReader reader(message);
    KernelReplyHeader header;
    std::uint16_t reserved = 0;
    std::uint32_t status = 0;
    if (!readHead(reader, kReplyMagic, header.operation, reserved, header.sequence) ||
        !reader.readU32(status) || !reader.readU32(header.reported)) {
        return std::nullopt;
    }
    header.status = static_cast<std::int32_t>(status);
    return header;
}

KernelPropertyPrefixBytes encodeKernelPropertyPrefix(std::size_t pathLength) {
    KernelPropertyPrefixBytes bytes{};
    base::ByteWriter writer(bytes);
    const bool fits = writer.writeU16(base::saturate<std::uint16_t>(pathLength));
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

KernelOpenPrefixBytes encodeKernelOpenPrefix(std::uint32_t connectionType) {
    KernelOpenPrefixBytes bytes{};
    base::ByteWriter writer(bytes);
    const bool fits = writer.writeU32(connectionType);
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

KernelStructPrefixBytes encodeKernelStructPrefix(std::uint32_t selector,
                                                 std::uint32_t offeredSize) {
    KernelStructPrefixBytes bytes{};
    base::ByteWriter writer(bytes);
    const bool fits = writer.writeU32(selector) && writer.writeU32(offeredSize);
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

KernelScalarPrefixBytes encodeKernelScalarPrefix(std::uint32_t selector, std::uint32_t offeredCount,
                                                 std::uint32_t inputCount) {
    KernelScalarPrefixBytes bytes{};
    base::ByteWriter writer(bytes);
    const bool fits =
        writer.writeU32(selector) && writer.writeU32(offeredCount) && writer.writeU32(inputCount);
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

KernelScalarBytes encodeKernelScalars(std::span<const std::uint64_t> scalars) {
    KernelScalarBytes bytes{};
    base::ByteWriter writer(bytes);
    bool fits = true;
    for (const std::uint64_t scalar : scalars) {
        fits = fits && writer.writeU64(scalar);
    }
    assert(fits);
    static_cast<void>(fits);
    return bytes;
}

std::optional<std::string_view> decodeKernelFindByPath(std::span<const std::uint8_t> body) {
    return wholeText(body, kKernelMaxPathLength);
}

std::optional<std::string_view> decodeKernelFindByClassName(std::span<const std::uint8_t> body) {
    return wholeText(body, kKernelMaxNameLength);
}

std::optional<KernelPropertyRequest> decodeKernelProperty(std::span<const std::uint8_t> body) {
    base::ByteReader reader(body);
    std::uint16_t pathLength = 0;
    std::span<const std::uint8_t> pathBytes;
    if (!reader.readU16(pathLength) || !reader.readSpan(pathBytes, pathLength)) {
        return std::nullopt;
    }
    const auto path = wholeText(pathBytes, kKernelMaxPathLength);
    const auto name = wholeText(reader.rest(), kKernelMaxNameLength);
    if (!path || !name) {
        return std::nullopt;
    }
    return KernelPropertyRequest{*path, *name};
}

std::optional<KernelOpenRequest> decodeKernelOpen(std::span<const std::uint8_t> body) {
    base::ByteReader reader(body);
    KernelOpenRequest request;
    if (!reader.readU32(request.connectionType)) {
        return std::nullopt;
    }
    const auto path = wholeText(reader.rest(), kKernelMaxPathLength);
    if (!path) {
        return std::nullopt;
    }
    request.path = *path;
    return request;
}

std::optional<KernelStructRequest> decodeKernelStruct(std::span<const std::uint8_t> body) {
    base::ByteReader reader(body);
    KernelStructRequest request;
    if (!reader.readU32(request.selector) || !reader.readU32(request.offeredSize)) {
        return std::nullopt;
    }
    request.input = reader.rest();
    return request;
}

std::optional<KernelScalarRequest> decodeKernelScalar(std::span<const std::uint8_t> body) {
    base::ByteReader reader(body);
    KernelScalarRequest request;
    std::uint32_t inputCount = 0;
    if (!reader.readU32(request.selector) || !reader.readU32(request.offeredCount) ||
        !reader.readU32(inputCount)) {
        return std::nullopt;
    }
    // Before there is room made for as many as a stranger says.
    if (inputCount > kKernelMaxScalars || request.offeredCount > kKernelMaxScalars) {
        return std::nullopt;
    }
    request.inputs.resize(inputCount);
    if (!decodeKernelScalars(reader.rest(), request.inputs)) {
        return std::nullopt;
    }
    return request;
}

bool decodeKernelScalars(std::span<const std::uint8_t> bytes, std::span<std::uint64_t> scalars) {
    if (scalars.size() > kKernelMaxScalars ||
        bytes.size() != scalars.size() * sizeof(std::uint64_t)) {
        return false;
    }
    base::ByteReader reader(bytes);
    for (std::uint64_t& scalar : scalars) {
        static_cast<void>(reader.readU64(scalar));
    }
    return true;
}

} // namespace wire
