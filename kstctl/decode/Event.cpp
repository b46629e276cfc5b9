#include "base/ByteReader.h"
#include "kstctl/TimeText.h"
#include "kstctl/decode/Decoders.h"
#include "wire/EventDatagram.h"

namespace kstctl::decode {

namespace {

/// An alarm's date in the payload of its event.
void addAlarmDate(Report& report, Bytes payload) {
    base::ByteReader reader(payload);
    std::uint64_t date = 0;
    if (reader.readU64(date) && reader.left() == 0) {
        const auto nanoseconds = static_cast<std::int64_t>(date);
        report.add("date", nanoseconds, timeText(platform::Date{nanoseconds}));
    }
}

} // namespace

Result decodeEvent(Bytes bytes, Secrets /*secrets*/) {
    const auto event = wire::decodeEvent(bytes);
    if (!event) {
        return malformed("not a well-formed event datagram");
    }
    Decoded decoded{.fields = {}, .size = bytes.size()};
    decoded.fields.add("stream", event->stream)
        .add("name", event->name)
        .add("payload", hexText(event->payload));
    if (event->stream == wire::kAlarmStream) {
        addAlarmDate(decoded.fields, event->payload);
    }
    return decoded;
}

} // namespace kstctl::decode
