#include "kstctl/Report.h"

#include "kstd/Analytics/SQLite/DatabaseTexts.h"
#include "kstd/Analytics/SQLite/DateFormatter.h"

namespace kstctl {

Report::Report() = default;
Report::Report(const Report& other) = default;
Report::Report(Report&& other) noexcept = default;
Report& Report::operator=(const Report& other) = default;
Report& Report::operator=(Report&& other) noexcept = default;
Report::~Report() = default;

Report& Report::add(std::string name, Datum value, std::string meaning) {
    fields_.push_back({std::move(name), std::move(value), std::move(meaning)});
    return *this;
}

bool Report::isEmpty() const {
    return fields_.empty();
}

Report::Datum::Datum(None none) : content_(none) {}
Report::Datum::Datum(Unknown unknown) : content_(std::move(unknown)) {}
Report::Datum::Datum(double value) : content_(value) {}
Report::Datum::Datum(std::string text) : content_(std::move(text)) {}
Report::Datum::Datum(std::string_view text) : content_(std::string(text)) {}
Report::Datum::Datum(const char* text) : content_(std::string(text)) {}
Report::Datum::Datum(Data list) : content_(std::move(list)) {}
Report::Datum::Datum(Report report) : content_(std::move(report)) {}
Report::Datum::Datum(Exactly /*exactly*/, Content content) : content_(std::move(content)) {}

Report::Datum::Datum(const Datum& other) = default;
Report::Datum::Datum(Datum&& other) noexcept = default;
Report::Datum& Report::Datum::operator=(const Datum& other) = default;
Report::Datum& Report::Datum::operator=(Datum&& other) noexcept = default;
Report::Datum::~Datum() = default;

std::string hexText(std::span<const std::uint8_t> bytes) {
    return kstd::RXLowercaseHexStringWithoutSpaces(bytes);
}

namespace {

constexpr std::int64_t kEndOfYear9999 = 253'402'300'800;

} // namespace

std::string timeText(platform::Timestamp time) {
    return kstd::DateFormatter().text(time);
}

std::string timeText(platform::Date time) {
    return timeText(platform::timestampOf(time));
}

std::string timeText(std::uint64_t secondsSince1970) {
    if (secondsSince1970 == 0 || secondsSince1970 >= kEndOfYear9999) {
        return {};
    }
    return timeText(platform::Timestamp{static_cast<double>(secondsSince1970) -
                                        static_cast<double>(platform::kSecondsFrom1970To2001)});
}

} // namespace kstctl
