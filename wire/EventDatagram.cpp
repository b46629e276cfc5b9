#include "wire/EventDatagram.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <utility>

namespace wire {

namespace {

bool isName(std::string_view text, std::size_t maxLength) {
    return !text.empty() && text.size() <= maxLength && text.find('\0') == std::string_view::npos;
}

bool readHeader(base::ByteReader& reader, std::size_t& streamLength, std::size_t& nameLength,
                std::size_t& payloadLength) {
    std::string_view magic;
    std::uint8_t version = 0;
    std::uint8_t streamField = 0;
    std::uint16_t nameField = 0;
    std::uint32_t payloadField = 0;
    if (!reader.readText(magic, sizeof kEventMagic) || !reader.readU8(version) ||
        !reader.readU8(streamField) || !reader.readU16(nameField) ||
        !reader.readU32(payloadField)) {
        return false;
    }
    streamLength = streamField;
    nameLength = nameField;
    payloadLength = payloadField;
    return magic == std::string_view(kEventMagic, sizeof kEventMagic) && version == kEventVersion;
}

} // namespace

std::optional<std::vector<std::uint8_t>> encodeEvent(std::string_view stream, std::string_view name,
                                                     std::span<const std::uint8_t> payload) {
    if (!isName(stream, kEventMaxStreamLength) || !isName(name, kEventMaxNameLength)) {
        return std::nullopt;
    }
    const std::size_t headAndNames = kEventHeaderSize + stream.size() + name.size();
    if (payload.size() > kEventMaxSize - headAndNames) {
        return std::nullopt;
    }
    std::vector<std::uint8_t> datagram(headAndNames + payload.size());
    base::ByteWriter writer(datagram);
    const bool fits =
        writer.writeText({kEventMagic, sizeof kEventMagic}) && writer.writeU8(kEventVersion) &&
        writer.writeU8(static_cast<std::uint8_t>(stream.size())) &&
        writer.writeU16(static_cast<std::uint16_t>(name.size())) &&
        writer.writeU32(static_cast<std::uint32_t>(payload.size())) && writer.writeText(stream) &&
        writer.writeText(name) && writer.writeBytes(payload.data(), payload.size());
    return fits ? std::optional(std::move(datagram)) : std::nullopt;
}

std::optional<EventDatagram> decodeEvent(std::span<const std::uint8_t> datagram) {
    if (datagram.size() > kEventMaxSize) {
        return std::nullopt;
    }
    base::ByteReader reader(datagram);
    std::size_t streamLength = 0;
    std::size_t nameLength = 0;
    std::size_t payloadLength = 0;
    EventDatagram event;
    if (!readHeader(reader, streamLength, nameLength, payloadLength) ||
        !reader.readText(event.stream, streamLength) || !reader.readText(event.name, nameLength) ||
        reader.left() != payloadLength) {
        return std::nullopt;
    }
    event.payload = reader.rest();
    if (!isName(event.stream, kEventMaxStreamLength) || !isName(event.name, kEventMaxNameLength)) {
        return std::nullopt;
    }
    return event;
}

} // namespace wire
