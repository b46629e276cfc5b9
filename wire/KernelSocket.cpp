#include "wire/KernelSocket.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"
#include "base/Saturate.h"

#include <cassert>
#include <utility>

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
              std::uint64_t& sequence) {
    std::string_view magic;
    std::uint8_t version = 0;
    std::uint8_t code = 0;
    std::uint16_t reserved = 0;
    if (!reader.readText(magic, expectedMagic.size()) || !reader.readU8(version) ||
        !reader.readU8(code) || !reader.readU16(reserved) || !reader.readU64(sequence)) {
        return false;
    }
    operation = static_cast<KernelOperation>(code);
    return magic == expectedMagic && version == kKernelSocketVersion && reserved == 0 &&
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
    if (!readHead(reader, kRequestMagic, header.operation, header.sequence)) {
        return std::nullopt;
    }
    return header;
}

std::optional<KernelReplyHeader> decodeKernelReplyHeader(std::span<const std::uint8_t> message) {
    base::ByteReader reader(message);
    KernelReplyHeader header;
    std::uint32_t status = 0;
    if (!readHead(reader, kReplyMagic, header.operation, header.sequence) ||
        !reader.readU32(status) || !reader.readU32(header.reported)) {
        return std::nullopt;
    }
    header.status = static_cast<std::int32_t>(status);
    return header;
}

std::vector<std::uint8_t> encodeKernelProperty(const KernelPropertyRequest& request) {
    std::vector<std::uint8_t> body(2 + request.path.size() + request.name.size());
    base::ByteWriter writer(body);
    const bool fits = writer.writeU16(base::saturate<std::uint16_t>(request.path.size())) &&
                      writer.writeText(request.path) && writer.writeText(request.name);
    assert(fits);
    static_cast<void>(fits);
    return body;
}

std::vector<std::uint8_t> encodeKernelOpen(const KernelOpenRequest& request) {
    std::vector<std::uint8_t> body(4 + request.path.size());
    base::ByteWriter writer(body);
    const bool fits = writer.writeU32(request.connectionType) && writer.writeText(request.path);
    assert(fits);
    static_cast<void>(fits);
    return body;
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

std::vector<std::uint8_t> encodeKernelScalar(const KernelScalarRequest& request) {
    std::vector<std::uint8_t> body(4 + 4 + 4 + 8 * request.inputs.size());
    base::ByteWriter writer(body);
    bool fits = writer.writeU32(request.selector) && writer.writeU32(request.offeredCount) &&
                writer.writeU32(static_cast<std::uint32_t>(request.inputs.size()));
    for (const std::uint64_t input : request.inputs) {
        fits = fits && writer.writeU64(input);
    }
    assert(fits);
    static_cast<void>(fits);
    return body;
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
    auto inputs = decodeKernelScalars(reader.rest(), inputCount);
    if (!inputs || request.offeredCount > kKernelMaxScalars) {
        return std::nullopt;
    }
    request.inputs = std::move(*inputs);
    return request;
}

std::optional<std::vector<std::uint64_t>> decodeKernelScalars(std::span<const std::uint8_t> bytes,
                                                              std::size_t count) {
    if (count > kKernelMaxScalars || bytes.size() != count * sizeof(std::uint64_t)) {
        return std::nullopt;
    }
    base::ByteReader reader(bytes);
    std::vector<std::uint64_t> scalars(count);
    for (std::uint64_t& scalar : scalars) {
        if (!reader.readU64(scalar)) {
            return std::nullopt;
        }
    }
    return scalars;
}

} // namespace wire
