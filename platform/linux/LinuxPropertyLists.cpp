#include "platform/linux/LinuxPropertyLists.h"

#include "platform/linux/XMLPropertyList.h"
#include "platform/shared/BinaryPropertyList.h"

#include <string_view>

namespace platform {

Result<Bytes> LinuxPropertyLists::binary(const Value& value) {
    return writeBinaryPropertyList(value);
}

bool LinuxPropertyLists::read(std::span<const std::uint8_t> data, ValueSink& sink) {
    const std::string_view start(reinterpret_cast<const char*>(data.data()), data.size());
    return start.starts_with(kBinaryPropertyListMagic) ? readBinaryPropertyList(data, sink)
                                                       : readXMLPropertyList(data, sink);
}

} // namespace platform
