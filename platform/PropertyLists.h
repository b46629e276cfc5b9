#pragma once

#include "base/NotCopied.h"
#include "platform/Result.h"
#include "platform/Value.h"
#include "platform/ValueBuilder.h"
#include "platform/ValueSink.h"

#include <cstdint>
#include <optional>
#include <span>

namespace platform {

/// Property lists: values as files keep them. Kinds: boolean, integer, real, text, bytes, date,
/// list, map. May be called from any thread.
class PropertyLists : private base::NotCopied {
  public:
    virtual ~PropertyLists() = default;

    /// `value` in the binary form, version 1.0. Fails with an error of kGenericErrorDomain when a
    /// value of another kind is anywhere in it, or a text that is not UTF-8 or holds a NUL; the
    /// description names the kind. Fails also when lists and maps are too deep in each other; what
    /// was written can always be read.
    [[nodiscard]] virtual Result<Bytes> binary(const Value& value) = 0;

    /// Reads a property list in the binary or in the XML form and hands it to the sink. False when
    /// it is not one, or passes the reader's limits; the sink has then taken some part of it.
    [[nodiscard]] virtual bool read(std::span<const std::uint8_t> data, ValueSink& sink) = 0;

    /// The whole property list, or none.
    [[nodiscard]] std::optional<Value> value(std::span<const std::uint8_t> data) {
        ValueBuilder builder;
        if (!read(data, builder)) {
            return std::nullopt;
        }
        return builder.take();
    }
};

} // namespace platform
