#pragma once

#include "platform/PropertyLists.h"

#include <mutex>
#include <optional>

namespace platform {

/// Property lists in the binary form only; one that is not is refused like any other bytes.
class FakePropertyLists final : public PropertyLists {
  public:
    [[nodiscard]] Result<Bytes> binary(const Value& value) override;
    [[nodiscard]] bool read(std::span<const std::uint8_t> data, ValueSink& sink) override;

    /// The next `binary` fails with this error, whatever it is given.
    void failNextBinary(Error error);

    /// The next `read` fails, whatever it is given; its sink takes nothing.
    void failNextRead();

  private:
    std::mutex mutex_;
    std::optional<Error> nextBinaryError_;
    bool nextReadFails_ = false;
};

} // namespace platform
