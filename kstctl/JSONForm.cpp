#include "base/Concat.h"
#include "kstctl/Forms.h"
#include "platform/formats/JSONCodec.h"
#include "platform/formats/UnicodeText.h"

#include <cmath>
#include <utility>

namespace kstctl {

namespace {

void write(const Report& report, platform::JSONWriter& json);
void write(const Data& list, platform::JSONWriter& json);

void writeText(std::string_view text, platform::JSONWriter& json) {
    if (platform::isUTF8WithoutNUL(text)) {
        json.text(text);
    } else {
        json.text(printable(text));
    }
}

struct DatumWriter {
    platform::JSONWriter& json;

    void operator()(const Report::None& /*none*/) const { json.null(); }
    void operator()(const Report::Unknown& /*unknown*/) const { json.null(); }
    void operator()(bool value) const { json.boolean(value); }
    void operator()(std::int64_t value) const { json.integer(value); }
    void operator()(std::uint64_t value) const {
        if (std::in_range<std::int64_t>(value)) {
            json.integer(static_cast<std::int64_t>(value));
        } else {
            json.largeInteger(value);
        }
    }
    void operator()(double value) const {
        if (std::isfinite(value)) {
            json.real(value);
        } else {
            json.null();
        }
    }
    void operator()(const std::string& text) const { writeText(text, json); }
    void operator()(const Data& list) const { write(list, json); }
    void operator()(const Report& report) const { write(report, json); }
};

void write(const Data& list, platform::JSONWriter& json) {
    json.beginList();
    for (const Report::Datum& datum : list) {
        std::visit(DatumWriter{json}, datum.content());
    }
    json.endList();
}

void write(const Report& report, platform::JSONWriter& json) {
    json.beginMap();
    for (const Field& field : report.fields()) {
        json.key(field.name);
        std::visit(DatumWriter{json}, field.value.content());
        if (!field.meaning.empty()) {
            json.key(base::concat(field.name, "Text"));
            writeText(field.meaning, json);
        }
        if (const auto* unknown = std::get_if<Report::Unknown>(&field.value.content())) {
            json.key(base::concat(field.name, "Unknown"));
            writeText(unknown->reason, json);
        }
    }
    json.endMap();
}

std::string objectOf(const Report& report) {
    platform::JSONWriter json;
    write(report, json);
    // An object is always something that JSON can express.
    const auto text = json.finish();
    return printableJSON(text.value().view());
}

} // namespace

std::string JSONForm(const Report& report) {
    return objectOf(report) + '\n';
}

JSONListForm::JSONListForm(const Report& head, std::string_view name) : start_(objectOf(head)) {
    start_.pop_back();
    start_ += base::concat(head.isEmpty() ? "" : ",", '"', name, "\":[");
}

std::string JSONListForm::element(const Report& report) {
    return base::concat(std::exchange(isFirst_, false) ? "" : ",", objectOf(report));
}

std::string JSONTextForm(std::string_view text) {
    platform::JSONWriter json;
    writeText(text, json);
    const auto quoted = json.finish();
    const std::string_view whole = quoted.value().view();
    return printableJSON(whole.substr(1, whole.size() - 2));
}

} // namespace kstctl
