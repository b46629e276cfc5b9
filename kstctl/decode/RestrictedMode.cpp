#include "wire/RestrictedMode.h"

#include "base/ByteReader.h"
#include "base/Concat.h"
#include "keystrand/NotificationRecord.h"
#include "kstctl/Report.h"
#include "kstctl/decode/Decoders.h"
#include "wire/EventDatagram.h"

#include <algorithm>

namespace kstctl::decode {

void addStateFields(Report& report, Bytes blob) {
    base::ByteReader reader(blob);
    std::uint32_t version = 0;
    std::uint64_t start = 0;
    std::uint8_t locked = 0;
    if (reader.readU32(version) && reader.readU64(start) && reader.readU8(locked)) {
        report.add("version", version)
            .add("standardModeStartTimestamp", start, timeText(start))
            .add("lockedInRestrictedMode", locked);
    }
}

Result decodeStateFile(Bytes bytes, Secrets /*secrets*/) {
    if (bytes.size() < wire::rm::kStateBlobSize) {
        return malformed(base::concat("a state file has at least ", wire::rm::kStateBlobSize,
                                      " bytes, not ", bytes.size()));
    }
    Decoded decoded{.fields = {}, .size = wire::rm::kStateBlobSize};
    addStateFields(decoded.fields, bytes);
    return decoded;
}

void addAnalyticsFields(Report& report, Bytes blob) {
    keystrand::AnalyticsBytes bytes{};
    std::copy_n(blob.begin(), bytes.size(), bytes.begin());
    const auto figures = keystrand::decodeFigures(bytes);
    if (!figures) {
        report.add("layout", "opaque").add("bytes", hexText(bytes));
        return;
    }
    report.add("layout", "keystrand-sim")
        .add("periodStart", figures->periodStart, timeText(figures->periodStart))
        .add("restrictedInPeriod", figures->restrictedInPeriod)
        .add("totalRestricted", figures->totalRestricted)
        .add("restrictedSince", figures->restrictedSince, timeText(figures->restrictedSince));
}

Result decodeAnalyticsFile(Bytes bytes, Secrets /*secrets*/) {
    if (bytes.size() < wire::rm::kAnalyticsBlobSize) {
        return malformed(base::concat("an analytics file has at least ",
                                      wire::rm::kAnalyticsBlobSize, " bytes, not ", bytes.size()));
    }
    Decoded decoded{.fields = {}, .size = wire::rm::kAnalyticsBlobSize};
    addAnalyticsFields(decoded.fields, bytes);
    return decoded;
}

using namespace wire::rm;

namespace {

std::uint64_t littleEndian(Bytes bytes) {
    std::uint64_t number = 0;
    for (std::size_t i = bytes.size(); i > 0; --i) {
        number = number << 8U | bytes[i - 1];
    }
    return number;
}

void addField(Report& report, const NotificationField& field, Bytes bytes) {
    const Bytes value = bytes.subspan(field.offset, field.size);
    switch (field.form) {
    case FieldForm::number:
        report.add(field.name, littleEndian(value));
        break;
    case FieldForm::seconds:
        report.add(field.name, littleEndian(value), timeText(littleEndian(value)));
        break;
    case FieldForm::stateBlob:
        addStateFields(report, value);
        break;
    case FieldForm::analyticsBlob:
        addAnalyticsFields(report, value);
        break;
    }
}

} // namespace

Result decodeRecord(Bytes bytes, Secrets /*secrets*/) {
    if (bytes.size() != kNotificationSize) {
        return malformed(base::concat("a notification record has ", kNotificationSize,
                                      " bytes, not ", bytes.size()));
    }
    const auto type =
        static_cast<std::uint32_t>(littleEndian(bytes.subspan(kNotificationTypeOffset, 4)));
    const NotificationKind* const kind = findNotificationKind(type);
    if (kind == nullptr) {
        return malformed(base::concat("there is no notification record of type ", type));
    }
    Decoded decoded{.fields = {}, .size = kNotificationSize};
    decoded.fields.add("type", type, kind->description);
    for (const NotificationField& field : kind->fields) {
        addField(decoded.fields, field, bytes);
    }
    return decoded;
}

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
