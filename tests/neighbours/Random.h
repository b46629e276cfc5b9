#pragma once

#include <algorithm>
#include <array>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace neighbours {

using Bytes = std::vector<std::uint8_t>;

/// What a neighbour must not bring about has happened.
class Fault : public std::runtime_error {
  public:
    using std::runtime_error::runtime_error;
};

inline void require(bool condition, const std::string& what) {
    if (!condition) {
        throw Fault(what);
    }
}

/// The same numbers for the same seed, whatever the machine and its libraries.
class Random {
  public:
    explicit Random(std::uint64_t seed) : state_(seed) {}

    std::uint64_t next() {
        std::uint64_t value = state_ += 0x9e3779b97f4a7c15U;
        value = (value ^ (value >> 30U)) * 0xbf58476d1ce4e5b9U;
        value = (value ^ (value >> 27U)) * 0x94d049bb133111ebU;
        return value ^ (value >> 31U);
    }

    /// From 0 on, `count` of them; 0 when there is none.
    std::size_t below(std::size_t count) { return count == 0 ? 0 : next() % count; }
    bool oneIn(std::size_t count) { return below(count) == 0; }

    template <typename Value, std::size_t kCount>
    const Value& of(const Value (&values)[kCount]) {
        return values[below(kCount)];
    }

    Bytes bytes(std::size_t count) {
        Bytes made(count);
        for (std::uint8_t& byte : made) {
            byte = static_cast<std::uint8_t>(next());
        }
        return made;
    }

    /// Small, at a power of two or next to it, large, or any.
    std::uint64_t number() {
        const std::uint64_t power = std::uint64_t{1} << below(64);
        switch (below(4)) {
        case 0:
            return below(40);
        case 1:
            return power + below(3) - 1;
        case 2:
            return ~std::uint64_t{0} - below(3);
        default:
            return next() >> below(64);
        }
    }

    /// A length up to `most`, often at an end.
    std::size_t length(std::size_t most) {
        switch (below(4)) {
        case 0:
            return most - std::min(most, below(2));
        case 1:
            return std::min(most, below(4));
        default:
            return below(std::min<std::size_t>(most, 64) + 1);
        }
    }

    /// Without a zero byte, of every kind that a line of the log could stumble over.
    std::string text(std::size_t length) {
        static constexpr std::string_view kPieces[] = {
            "\n", "\x1b[2J", "\xe2\x80\xae", "%s%n", "\xff", "\xc2\x85", "../", "\"", "com.zerva."};
        std::string made;
        while (made.size() < length) {
            if (oneIn(6)) {
                made += of(kPieces);
            } else {
                made += static_cast<char>(oneIn(8) ? 1 + below(255) : 'a' + below(26));
            }
        }
        made.resize(length);
        return made;
    }

  private:
    std::uint64_t state_;
};

/// One to three changes as a faulty or hostile peer makes them: a bit, a number where one may
/// stand, a byte of a length, a piece cut off, put in or repeated.
inline void mutate(Random& random, Bytes& bytes) {
    for (std::size_t changes = 1 + random.below(3); changes > 0; --changes) {
        const std::size_t place = random.below(bytes.size());
        switch (random.below(6)) {
        case 0:
            if (!bytes.empty()) {
                bytes[place] ^= static_cast<std::uint8_t>(1U << random.below(8));
            }
            break;
        case 1:
        case 2: {
            // Where headers are.
            const std::size_t head =
                random.oneIn(2) ? random.below(std::min<std::size_t>(bytes.size(), 32)) : place;
            std::uint64_t number = random.number();
            for (std::size_t i = head;
                 i < std::min(bytes.size(), head + (std::size_t{1} << random.below(4))); ++i) {
                bytes[i] = static_cast<std::uint8_t>(number);
                number >>= 8U;
            }
            break;
        }
        case 3:
            bytes.resize(place);
            break;
        case 4: {
            const Bytes more = random.bytes(random.length(64));
            bytes.insert(bytes.begin() + static_cast<std::ptrdiff_t>(place), more.begin(),
                         more.end());
            break;
        }
        default: {
            const Bytes piece(bytes.begin() + static_cast<std::ptrdiff_t>(place),
                              bytes.begin() +
                                  static_cast<std::ptrdiff_t>(std::min(bytes.size(), place + 40)));
            bytes.insert(bytes.end(), piece.begin(), piece.end());
            break;
        }
        }
    }
}

/// Little-endian.
template <std::integral Integer>
void put(Bytes& bytes, std::size_t offset, Integer value) {
    auto rest = static_cast<std::uint64_t>(value);
    for (std::size_t i = 0; i < sizeof value; ++i) {
        bytes[offset + i] = static_cast<std::uint8_t>(rest);
        rest >>= 8U;
    }
}

template <std::integral Integer>
void append(Bytes& bytes, Integer value) {
    bytes.resize(bytes.size() + sizeof value);
    put(bytes, bytes.size() - sizeof value, value);
}

inline void append(Bytes& bytes, std::span<const std::uint8_t> more) {
    bytes.insert(bytes.end(), more.begin(), more.end());
}

inline void append(Bytes& bytes, std::string_view text) {
    bytes.insert(bytes.end(), text.begin(), text.end());
}

} // namespace neighbours
