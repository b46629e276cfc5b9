#include "common/ReceivedBlob.h"

#include "common/Allocation.h"
#include "common/SerializationContext.h"

#include <utility>

namespace kst {

ReceivedBlob::~ReceivedBlob() {
    release(bytes_, length_, written_);
}

KSTStatus ReceivedBlob::read(base::ByteReader& reader, std::size_t length, const char* memoryCheck,
                             const char* sizeCheck, int line) noexcept {
    if (length == 0) {
        return kKSTErrorSuccess;
    }
    bytes_ = static_cast<std::uint8_t*>(allocate(length));
    if (bytes_ == nullptr) {
        return fail(serializationContext(), memoryCheck, 0, kKSTErrorOutOfMemory, line);
    }
    length_ = length;
    if (!reader.readBytes(bytes_, length)) {
        return fail(serializationContext(), sizeCheck, 0, kKSTErrorBadParameter, line);
    }
    written_ = length;
    return kKSTErrorSuccess;
}

KSTStatus ReceivedBlob::readWithLength(base::ByteReader& reader, const char* memoryCheck,
                                       const char* sizeCheck, int line) noexcept {
    std::uint32_t length = 0;
    if (!reader.readU32(length)) {
        return fail(serializationContext(), "(size - offset) >= sizeof(uint32_t)", 0,
                    kKSTErrorBadParameter, line);
    }
    return read(reader, length, memoryCheck, sizeCheck, line);
}

std::uint8_t* ReceivedBlob::handOut() noexcept {
    return std::exchange(bytes_, nullptr);
}

} // namespace kst
