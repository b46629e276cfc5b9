#pragma once

#include "base/NotCopied.h"
#include "platform/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace platform {

/// Takes one value piece by piece, so that a large one need never be held whole. What is handed
/// over lasts only for the call.
///
/// A map is beginMap, then key and value for each entry, sorted by the keys' bytes with no key
/// twice, then endMap. A list is beginList, the values, endList. Sources keep to this.
class ValueSink : private base::NotCopied {
  public:
    virtual ~ValueSink() = default;

    virtual void beginMap() = 0;
    virtual void key(std::string_view key) = 0;
    /// The same, for a key that comes often. `form` comes with it every time, empty at first, and
    /// is the sink's, to keep there what it makes of the key.
    virtual void repeatedKey(std::string_view key, std::string& /*form*/) { this->key(key); }
    virtual void endMap() = 0;
    virtual void beginList() = 0;
    virtual void endList() = 0;

    virtual void null() = 0;
    virtual void boolean(bool value) = 0;
    virtual void integer(std::int64_t value) = 0;
    /// Only above the range of `integer`.
    virtual void largeInteger(std::uint64_t value) = 0;
    virtual void real(double value) = 0;
    virtual void text(std::string_view utf8) = 0;
    virtual void bytes(std::span<const std::uint8_t> value) = 0;
    virtual void date(Timestamp value) = 0;
    /// An identifier, a link or an error, by the name of its kind.
    virtual void other(std::string_view kind) = 0;
};

/// Hands a value that is held whole to a sink.
void describe(const Value& value, ValueSink& sink);

} // namespace platform
