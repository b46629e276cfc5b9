#pragma once

#include "base/NotCopied.h"
#include "platform/Result.h"
#include "platform/Value.h"
#include "platform/ValueBuilder.h"
#include "platform/ValueSink.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// The keys of maps that were read, kept for those that are read next: the rows of a table have the
/// same few sets of keys. Whoever reads many property lists has one, for one sink and one thread.
struct KnownKeys {
    struct Key {
        /// As it stands in the property list, which ends with its text.
        std::string object;
        std::size_t textSize = 0;
        /// The sink's.
        std::string form;

        [[nodiscard]] std::string_view text() const {
            return std::string_view(object).substr(object.size() - textSize);
        }
    };

    /// Those of one map, all in ASCII, in the order of their bytes.
    using Set = std::vector<Key>;

    std::array<Set, 4> sets;
    /// The one whose place the next set takes.
    std::size_t oldest = 0;
};

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

    /// The same, and faster when the outermost map has keys that `known` has.
    [[nodiscard]] virtual bool readKnowing(KnownKeys& /*known*/, std::span<const std::uint8_t> data,
                                           ValueSink& sink) {
        return read(data, sink);
    }

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
