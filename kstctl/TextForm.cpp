#include "base/Concat.h"
#include "kstctl/Forms.h"
#include "kstctl/TerminalText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <string_view>

namespace kstctl {

namespace {

constexpr std::string_view kBold = "\x1b[1m";
constexpr std::string_view kYellow = "\x1b[33m";
constexpr std::string_view kPlain = "\x1b[0m";

std::string coloured(std::string_view text, std::string_view colour, Colours colours) {
    return colours == Colours::yes ? base::concat(colour, text, kPlain) : std::string(text);
}

std::string shortest(double value) {
    std::array<char, 32> digits{};
    auto* const end = std::to_chars(digits.data(), digits.data() + digits.size(), value).ptr;
    return {digits.data(), end};
}

/// Writes fields and lists line by line.
class Writer {
  public:
    explicit Writer(Colours colours) : colours_(colours) {}

    void write(const Report& report, std::size_t depth) {
        for (const Field& field : report.fields()) {
            text_ += indent(depth);
            writeField(field, depth);
        }
    }

    [[nodiscard]] std::string take() { return std::move(text_); }

  private:
    static std::string indent(std::size_t depth) { return std::string(2 * depth, ' '); }

    void writeField(const Field& field, std::size_t depth) {
        text_ += coloured(base::concat(printable(field.name), ':'), kBold, colours_);
        writeDatum(field.value, field.meaning, depth);
    }

    /// Writes what follows a name's colon, and the end of the line.
    void writeDatum(const Report::Datum& datum, const std::string& meaning, std::size_t depth) {
        if (const auto* const report = std::get_if<Report>(&datum.content())) {
            endLine(meaning, report->isEmpty());
            write(*report, depth + 1);
        } else if (const auto* const list = std::get_if<Data>(&datum.content())) {
            endLine(meaning, list->empty());
            writeList(*list, depth + 1);
        } else {
            text_ += base::concat(' ', simple(datum));
            endLine(meaning, false);
        }
    }

    void endLine(const std::string& meaning, bool isEmpty) {
        text_ += isEmpty ? " none" : "";
        text_ += meaning.empty() ? std::string() : base::concat(" (", printable(meaning), ')');
        text_ += '\n';
    }

    void writeList(const Data& list, std::size_t depth) {
        for (const Report::Datum& element : list) {
            const std::size_t start = text_.size();
            const auto* const report = std::get_if<Report>(&element.content());
            if (report != nullptr && !report->isEmpty()) {
                write(*report, depth + 1);
                text_[start + 2 * depth] = '-';
            } else {
                text_ += base::concat(indent(depth), '-');
                writeDatum(element, {}, depth);
            }
        }
    }

    [[nodiscard]] std::string simple(const Report::Datum& datum) const {
        return std::visit(
            [this](const auto& content) -> std::string {
                using Kind = std::remove_cvref_t<decltype(content)>;
                if constexpr (std::same_as<Kind, Report::None>) {
                    return "none";
                } else if constexpr (std::same_as<Kind, Report::Unknown>) {
                    return coloured(base::concat("unknown: ", printable(content.reason)), kYellow,
                                    colours_);
                } else if constexpr (std::same_as<Kind, bool>) {
                    return content ? "yes" : "no";
                } else if constexpr (std::integral<Kind>) {
                    return base::concat(content);
                } else if constexpr (std::same_as<Kind, double>) {
                    return shortest(content);
                } else if constexpr (std::same_as<Kind, std::string>) {
                    return printable(content);
                } else {
                    return {};
                }
            },
            datum.content());
    }

    Colours colours_;
    std::string text_;
};

std::vector<std::vector<std::string>> printableRows(const Table& table) {
    std::vector<std::vector<std::string>> rows;
    rows.reserve(table.rows.size() + 1);
    rows.push_back(table.headings);
    for (const auto& row : table.rows) {
        rows.push_back(row);
    }
    for (auto& row : rows) {
        std::transform(row.begin(), row.end(), row.begin(),
                       [](const std::string& text) { return printable(text); });
    }
    return rows;
}

std::vector<std::size_t> widthsOf(const std::vector<std::vector<std::string>>& rows) {
    std::vector<std::size_t> widths(rows.front().size());
    for (const auto& row : rows) {
        for (std::size_t column = 0; column < row.size(); ++column) {
            widths[column] = std::max(widths[column], characterCount(row[column]));
        }
    }
    return widths;
}

} // namespace

std::string textForm(const Report& report, Colours colours) {
    Writer writer(colours);
    writer.write(report, 0);
    return writer.take();
}

std::string textForm(const Table& table, Colours colours) {
    const auto rows = printableRows(table);
    const std::vector<std::size_t> widths = widthsOf(rows);
    std::string text;
    for (const auto& row : rows) {
        std::string line;
        std::size_t missing = 0;
        for (std::size_t column = 0; column < row.size(); ++column) {
            if (!row[column].empty()) {
                line += std::string(missing, ' ');
                line += row[column];
                missing = 0;
            }
            missing += widths[column] - characterCount(row[column]) + 2;
        }
        text += &row == &rows.front() ? coloured(line, kBold, colours) : line;
        text += '\n';
    }
    return text;
}

std::string tabbedForm(const Table& table) {
    std::string text;
    for (const auto& row : printableRows(table)) {
        for (std::size_t column = 0; column < row.size(); ++column) {
            text += column == 0 ? "" : "\t";
            text += row[column];
        }
        text += '\n';
    }
    return text;
}

} // namespace kstctl
