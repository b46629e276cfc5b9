#include "common/NumberedPayload.h"

#include "base/ByteWriter.h"

#include <algorithm>

namespace kst {

NumberedPayload::NumberedPayload(std::uint32_t number, const void* data, std::size_t dataSize,
                                 const AssertionContext& context) noexcept
    : size_(sizeof number + std::min(dataSize, kMaxDataSize)) {
    base::ByteWriter writer(bytes_.data(), size_);
    const bool fits = writer.writeU32(number) && writer.writeBytes(data, dataSize);
    if (!fits || writer.left() != 0) {
        stop(context, "commandCursor == commandBuffer + sizeof(commandBuffer)");
    }
}

} // namespace kst
