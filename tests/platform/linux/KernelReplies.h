#pragma once

#include "base/ByteWriter.h"
#include "tests/support/SeqpacketServer.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string_view>

namespace support {

/// A reply to `request`, put together by hand: its operation and sequence, then what is given.
inline Packet reply(const Packet& request, std::int32_t status, std::uint32_t reported,
                    std::string_view body) {
    Packet packet(24 + body.size());
    base::ByteWriter writer(packet);
    const bool fits = writer.writeText("KSTR") && writer.writeU8(1) && writer.writeU8(request[5]) &&
                      writer.writeU16(0) && writer.writeBytes(&request[8], 8) &&
                      writer.writeU32(static_cast<std::uint32_t>(status)) &&
                      writer.writeU32(reported) && writer.writeText(body);
    EXPECT_TRUE(fits);
    return packet;
}

} // namespace support
