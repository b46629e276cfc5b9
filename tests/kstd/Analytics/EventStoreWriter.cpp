#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/fake/FakeClock.h"
#include "platform/fake/FakeFormats.h"
#include "platform/fake/FakeSystemLog.h"

#include <cstdint>
#include <iostream>
#include <limits>
#include <string>

// EventStoreWriter FILE: writes the events that check-event-store-file knows, a day apart.

namespace {

using platform::Bytes;
using platform::ValueList;
using platform::ValueMap;

ValueMap numbers() {
    return {{"eventType", "numbers"},
            {"true", true},
            {"false", false},
            {"signed 8", std::numeric_limits<std::int8_t>::min()},
            {"signed 16", std::numeric_limits<std::int16_t>::min()},
            {"signed 32", std::numeric_limits<std::int32_t>::min()},
            {"signed 64", std::numeric_limits<std::int64_t>::min()},
            {"unsigned 8", std::uint8_t{1}},
            {"unsigned 16", std::numeric_limits<std::uint16_t>::max()},
            {"unsigned 32", std::numeric_limits<std::uint32_t>::max()},
            {"unsigned 64", std::numeric_limits<std::uint64_t>::max()},
            {"float", 0.5F},
            {"double", -1700000000500.25}};
}

ValueMap others() {
    return {{"eventType", "others"},
            {"empty text", ""},
            {"text", "Gr\xc3\xbc\xc3\x9f"
                     "e \xf0\x9f\x8c\x8d"},
            {"long text", std::string(70'000, 'l')},
            {"no bytes", Bytes()},
            {"bytes", Bytes{0, 1, 0xff}},
            {"date", platform::Timestamp{721'692'800.5}},
            {"list", ValueList{1, "two", ValueList(), ValueMap()}},
            {"map", ValueMap{{"inner", ValueMap{{"k", "v"}}}}}};
}

} // namespace

int main(int count, char** arguments) {
    if (count != 2) {
        std::cerr << "usage: EventStoreWriter FILE\n";
        return 2;
    }
    platform::FakeSystemLog log;
    platform::FakeClock clock;
    platform::FakePropertyLists propertyLists;
    {
        const auto store = kstd::TQAnalyticsLoggerSQLiteStore::storeWithPath(
            arguments[1], kstd::kEventSchema, {log, clock, propertyLists});
        for (const ValueMap& event : {numbers(), others(), ValueMap()}) {
            store->addEventDict(event, kstd::kEventTable);
            clock.advance(24 * 3600 * platform::kNanosecondsPerSecond);
        }
        store->setUploadDate(platform::timestampOf(clock.now()));
    }
    kstd::TQAnalyticsLoggerSQLiteStore::releaseStores();
    for (const std::string& line : log.texts()) {
        std::cerr << line << '\n';
    }
    return log.texts().empty() ? 0 : 1;
}
