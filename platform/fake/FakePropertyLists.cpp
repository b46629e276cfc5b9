#include "platform/fake/FakePropertyLists.h"

#include "platform/shared/BinaryPropertyList.h"

#include <utility>

namespace platform {

Result<Bytes> FakePropertyLists::binary(const Value& value) {
    {
        const std::lock_guard lock(mutex_);
        if (nextBinaryError_) {
            return *std::exchange(nextBinaryError_, std::nullopt);
        }
    }
    return writeBinaryPropertyList(value);
}

bool FakePropertyLists::read(std::span<const std::uint8_t> data, ValueSink& sink) {
    {
        const std::lock_guard lock(mutex_);
        if (std::exchange(nextReadFails_, false)) {
            return false;
        }
    }
    return readBinaryPropertyList(data, sink);
}

void FakePropertyLists::failNextBinary(Error error) {
    const std::lock_guard lock(mutex_);
    nextBinaryError_ = std::move(error);
}

void FakePropertyLists::failNextRead() {
    const std::lock_guard lock(mutex_);
    nextReadFails_ = true;
}

} // namespace platform
