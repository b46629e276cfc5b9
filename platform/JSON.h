#pragma once

#include "base/NotCopied.h"
#include "base/TextBuffer.h"
#include "platform/Result.h"
#include "platform/Value.h"
#include "platform/ValueSink.h"

#include <cstddef>
#include <memory>
#include <string_view>

namespace platform {

struct JSONWritingOptions {
    /// A line for each entry of a map or list, two blanks deeper than what holds it, and a blank
    /// behind each key's colon. Otherwise the text is compact.
    bool isPretty = false;
};

/// One JSON text in the making, in UTF-8. A map's keys come out in the order in which they come in.
///
/// Reals always have a fraction (1700000000000.0). What JSON cannot express (bytes, a date, an
/// identifier, a link, an error, a number that is not finite, a text or key that is not UTF-8) is
/// left out together with its key; the text goes on.
class JSONText : public ValueSink {
  public:
    /// A place in the text to which it can be taken back, as long as the map or list in which the
    /// place was taken is still open. It stands between two values, never between key and value.
    struct Mark {
        std::size_t size = 0;
        std::size_t depth = 0;
        bool isFirst = true;
    };

    [[nodiscard]] virtual Mark mark() const = 0;
    virtual void rewind(const Mark& mark) = 0;

    /// Moves what is there of the text behind what is in `taken`, so that a long text need never be
    /// held whole. Between two values; places that were taken before are none any more.
    virtual void moveTo(base::TextBuffer& taken) = 0;

    /// The text, or what is left of it, once every map and list is ended; the object is of no use
    /// after it. Fails when nothing that JSON can express came in or a map or list is still open.
    [[nodiscard]] virtual Result<base::TextBuffer> finish() = 0;
};

/// JSON (RFC 8259). May be called from any thread.
class JSON : private base::NotCopied {
  public:
    virtual ~JSON() = default;

    [[nodiscard]] virtual std::unique_ptr<JSONText>
    makeText(const JSONWritingOptions& options = {}) = 0;

    /// The value that the whole text is. Strict: no comments, no trailing commas, nothing behind
    /// the value, valid UTF-8, numbers in the range of a double (one too small to be told from zero
    /// is out of it). A number without fraction and exponent is an integer (signed 64-bit, or
    /// unsigned 64-bit above that) as far as it fits, any other number a double. Of a key that
    /// stands twice the later value counts. Fails for a text longer than kMaxJSONSize or nested
    /// deeper than kMaxJSONDepth; the error says why and at which byte.
    [[nodiscard]] virtual Result<Value> read(std::string_view text) = 0;
};

inline constexpr std::size_t kMaxJSONSize = 1024UL * 1024;
inline constexpr std::size_t kMaxJSONDepth = 128;

} // namespace platform
