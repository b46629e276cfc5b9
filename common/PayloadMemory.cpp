#include "common/PayloadMemory.h"

#include "base/ByteWriter.h"
#include "common/Failure.h"

#include <algorithm>
#include <string.h>
#include <utility>

namespace kst {

NumberedPayload::NumberedPayload(std::uint32_t number, const void* data, std::size_t dataSize,
                                 const AssertionContext& context) noexcept
    : size_(sizeof number + std::min(dataSize, kMaxDataSize)) {
    base::ByteWriter writer(bytes_.data(), size_);
    static_cast<void>(writer.writeU32(number));
    if (!writer.writeBytes(data, dataSize)) {
        stop(context, "commandCursor == commandBuffer + sizeof(commandBuffer)");
    }
}

ReceivedBlob::~ReceivedBlob() {
    if (bytes_ != nullptr) {
        ::explicit_bzero(bytes_, written_);
    }
    buffer_.leave();
    release(bytes_, length_, written_);
}

KSTStatus ReceivedBlob::read(base::ByteReader& reader, std::size_t length, const char* memoryCheck,
                             const char* sizeCheck) noexcept {
    if (length == 0) {
        return kKSTErrorSuccess;
    }
    bytes_ = static_cast<std::uint8_t*>(allocateUncleared(length));
    if (bytes_ == nullptr) {
        return fail(serializationContext(), memoryCheck, 0, kKSTErrorOutOfMemory);
    }
    length_ = length;
    if (reader.left() < length) {
        return fail(serializationContext(), sizeCheck, 0, kKSTErrorBadParameter);
    }
    buffer_.hold(bytes_, length);
    written_ = length;
    static_cast<void>(reader.readBytes(bytes_, length));
    return kKSTErrorSuccess;
}

KSTStatus ReceivedBlob::readWithLength(base::ByteReader& reader, const char* memoryCheck,
                                       const char* sizeCheck) noexcept {
    std::uint32_t length = 0;
    if (!reader.readU32(length)) {
        return fail(serializationContext(), "(size - offset) >= sizeof(uint32_t)", 0,
                    kKSTErrorBadParameter);
    }
    return read(reader, length, memoryCheck, sizeCheck);
}

std::uint8_t* ReceivedBlob::handOut() noexcept {
    buffer_.leave();
    return std::exchange(bytes_, nullptr);
}

} // namespace kst
