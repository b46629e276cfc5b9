#pragma once

#include "platform/PropertyLists.h"

namespace platform {

/// Property lists: the binary form by BinaryPropertyList.h, everything that does not begin with its
/// magic by XMLPropertyList.h. Both headers say what is read and how far.
class LinuxPropertyLists final : public PropertyLists {
  public:
    [[nodiscard]] Result<Bytes> binary(const Value& value) override;
    [[nodiscard]] bool read(std::span<const std::uint8_t> data, ValueSink& sink) override;
};

} // namespace platform
