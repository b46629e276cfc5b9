#include "wire/EventDatagram.h"

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <vector>

namespace {

using Bytes = std::vector<std::uint8_t>;
using wire::decodeEvent;
using wire::encodeEvent;

Bytes bytesOf(std::string_view text) {
    return {text.begin(), text.end()};
}

/// Stream "st", name "nam", payload 1 2 3 4.
const Bytes kSample{'K', 'S', 'T', 'E', 1,   2,   3, 0, 4, 0, 0,
                    0,   's', 't', 'n', 'a', 'm', 1, 2, 3, 4};

Bytes sampleWith(std::size_t offset, std::uint8_t value) {
    Bytes changed = kSample;
    changed.at(offset) = value;
    return changed;
}

} // namespace

TEST(EncodeEvent, ExactBytes) {
    EXPECT_EQ(encodeEvent("st", "nam", Bytes{1, 2, 3, 4}), kSample);
}

TEST(EncodeEvent, TheDocumentedExample) {
    const auto datagram =
        encodeEvent("com.zerva.notifyd.matching", "com.zerva.Keystrand.KSTRMTimerRestarted");
    ASSERT_TRUE(datagram);
    EXPECT_EQ(datagram->size(), 77U);
    const Bytes begin{0x4b, 0x53, 0x54, 0x45, 0x01, 0x1a, 0x27, 0x00, 0x00, 0x00, 0x00, 0x00,
                      0x63, 0x6f, 0x6d, 0x2e, 0x7a, 0x65, 0x72, 0x76, 0x61, 0x2e, 0x6e, 0x6f};
    EXPECT_EQ(Bytes(datagram->begin(), datagram->begin() + 24), begin);
}

TEST(EncodeEvent, NamesAtTheirLimits) {
    EXPECT_FALSE(encodeEvent("", "n"));
    EXPECT_FALSE(encodeEvent("s", ""));
    EXPECT_TRUE(encodeEvent("s", "n"));
    EXPECT_TRUE(encodeEvent(std::string(254, 's'), "n"));
    EXPECT_TRUE(encodeEvent(std::string(255, 's'), "n"));
    EXPECT_FALSE(encodeEvent(std::string(256, 's'), "n"));
    EXPECT_TRUE(encodeEvent("s", std::string(1023, 'n')));
    EXPECT_TRUE(encodeEvent("s", std::string(1024, 'n')));
    EXPECT_FALSE(encodeEvent("s", std::string(1025, 'n')));
    EXPECT_FALSE(encodeEvent("s", std::string(70000, 'n')));
}

TEST(EncodeEvent, ZeroBytesInNames) {
    EXPECT_FALSE(encodeEvent(std::string_view("s\0", 2), "n"));
    EXPECT_FALSE(encodeEvent("s", std::string_view("\0n", 2)));
    EXPECT_TRUE(encodeEvent("s", "n", Bytes{0, 0}));
}

TEST(EncodeEvent, SizeAtItsLimit) {
    const std::size_t room = 4096 - 12 - 1 - 1;
    EXPECT_EQ(encodeEvent("s", "n", Bytes(room - 1)).value_or(Bytes{}).size(), 4095U);
    EXPECT_EQ(encodeEvent("s", "n", Bytes(room)).value_or(Bytes{}).size(), 4096U);
    EXPECT_FALSE(encodeEvent("s", "n", Bytes(room + 1)));
    const auto largestNames =
        encodeEvent(std::string(255, 's'), std::string(1024, 'n'), Bytes(4096 - 12 - 255 - 1024));
    EXPECT_EQ(largestNames.value_or(Bytes{}).size(), 4096U);
}

TEST(DecodeEvent, TheSample) {
    const auto event = decodeEvent(kSample);
    ASSERT_TRUE(event);
    EXPECT_EQ(event->stream, "st");
    EXPECT_EQ(event->name, "nam");
    EXPECT_EQ(Bytes(event->payload.begin(), event->payload.end()), (Bytes{1, 2, 3, 4}));
    EXPECT_EQ(static_cast<const void*>(event->stream.data()), kSample.data() + 12);
}

TEST(DecodeEvent, EveryTruncation) {
    for (std::size_t length = 0; length < kSample.size(); ++length) {
        const Bytes cut(kSample.begin(), kSample.begin() + static_cast<std::ptrdiff_t>(length));
        EXPECT_FALSE(decodeEvent(cut)) << length;
    }
    EXPECT_FALSE(decodeEvent({}));
}

TEST(DecodeEvent, TrailingByte) {
    Bytes longer = kSample;
    longer.push_back(0);
    EXPECT_FALSE(decodeEvent(longer));
}

TEST(DecodeEvent, OtherMagic) {
    for (std::size_t offset = 0; offset < 4; ++offset) {
        EXPECT_FALSE(decodeEvent(sampleWith(offset, kSample[offset] ^ 0x20U))) << offset;
    }
}

TEST(DecodeEvent, OtherVersion) {
    for (const int version : {0, 2, 255}) {
        EXPECT_FALSE(decodeEvent(sampleWith(4, static_cast<std::uint8_t>(version)))) << version;
    }
}

TEST(DecodeEvent, LengthsThatDoNotAddUp) {
    for (std::size_t offset = 5; offset < 12; ++offset) {
        for (int value = 0; value < 256; ++value) {
            if (value != kSample[offset]) {
                EXPECT_FALSE(decodeEvent(sampleWith(offset, static_cast<std::uint8_t>(value))))
                    << offset << " " << value;
            }
        }
    }
}

TEST(DecodeEvent, LengthsAtTheirMaximum) {
    Bytes datagram = kSample;
    for (std::size_t offset = 5; offset < 12; ++offset) {
        datagram[offset] = 0xff;
    }
    EXPECT_FALSE(decodeEvent(datagram));
}

TEST(DecodeEvent, EmptyStreamOrNameThatAddsUp) {
    const Bytes emptyStream{'K', 'S', 'T', 'E', 1, 0, 1, 0, 0, 0, 0, 0, 'n'};
    const Bytes emptyName{'K', 'S', 'T', 'E', 1, 1, 0, 0, 0, 0, 0, 0, 's'};
    const Bytes both{'K', 'S', 'T', 'E', 1, 0, 0, 0, 0, 0, 0, 0};
    const Bytes neither{'K', 'S', 'T', 'E', 1, 1, 1, 0, 0, 0, 0, 0, 's', 'n'};
    EXPECT_FALSE(decodeEvent(emptyStream));
    EXPECT_FALSE(decodeEvent(emptyName));
    EXPECT_FALSE(decodeEvent(both));
    EXPECT_TRUE(decodeEvent(neither));
}

TEST(DecodeEvent, NamesAtTheirLimits) {
    const auto datagramOf = [](std::size_t nameLength) {
        Bytes datagram{'K', 'S', 'T', 'E', 1, 1};
        datagram.push_back(static_cast<std::uint8_t>(nameLength & 0xffU));
        datagram.push_back(static_cast<std::uint8_t>(nameLength >> 8U));
        datagram.insert(datagram.end(), {0, 0, 0, 0, 's'});
        datagram.insert(datagram.end(), nameLength, 'n');
        return datagram;
    };
    EXPECT_TRUE(decodeEvent(datagramOf(1023)));
    EXPECT_TRUE(decodeEvent(datagramOf(1024)));
    EXPECT_FALSE(decodeEvent(datagramOf(1025)));

    const auto longestStream = encodeEvent(std::string(255, 's'), "n");
    ASSERT_TRUE(longestStream);
    EXPECT_EQ(decodeEvent(*longestStream)->stream.size(), 255U);
}

TEST(DecodeEvent, ZeroBytesInNames) {
    EXPECT_FALSE(decodeEvent(sampleWith(12, 0)));
    EXPECT_FALSE(decodeEvent(sampleWith(13, 0)));
    EXPECT_FALSE(decodeEvent(sampleWith(14, 0)));
    EXPECT_FALSE(decodeEvent(sampleWith(16, 0)));
    EXPECT_TRUE(decodeEvent(sampleWith(17, 0)));
}

TEST(DecodeEvent, SizeAtItsLimit) {
    const auto datagramOf = [](std::size_t size) {
        const std::size_t payloadLength = size - 14;
        Bytes datagram{'K', 'S', 'T', 'E', 1, 1, 1, 0};
        datagram.push_back(static_cast<std::uint8_t>(payloadLength & 0xffU));
        datagram.push_back(static_cast<std::uint8_t>(payloadLength >> 8U));
        datagram.insert(datagram.end(), {0, 0, 's', 'n'});
        datagram.resize(size);
        return datagram;
    };
    EXPECT_TRUE(decodeEvent(datagramOf(4095)));
    EXPECT_TRUE(decodeEvent(datagramOf(4096)));
    EXPECT_FALSE(decodeEvent(datagramOf(4097)));
}

TEST(DecodeEvent, TakesBackWhatWasEncoded) {
    const Bytes payload = bytesOf("payload");
    const auto datagram = encodeEvent("com.zerva.alarm", "com.zerva.kstd.alarm", payload);
    ASSERT_TRUE(datagram);
    const auto event = decodeEvent(*datagram);
    ASSERT_TRUE(event);
    EXPECT_EQ(encodeEvent(event->stream, event->name, event->payload), datagram);
    EXPECT_EQ(event->stream, wire::kAlarmStream);
}

TEST(EventStreams, Names) {
    EXPECT_EQ(std::string_view(wire::kNotifydMatchingStream), "com.zerva.notifyd.matching");
    EXPECT_EQ(std::string_view(wire::kCorvidMatchingStream), "com.zerva.corvid.matching");
    EXPECT_EQ(std::string_view(wire::kAlarmStream), "com.zerva.alarm");
}
