#include "base/Concat.h"
#include "kstctl/Forms.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <string_view>
#include <utility>

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

/// However narrow a terminal is.
constexpr std::size_t kLeastRoom = 20;
constexpr std::size_t kBetweenColumns = 2;
constexpr std::string_view kIndent = "  ";

/// How many bytes of the text stand in a line of `room` characters: up to its last blank there, or
/// as many as fit.
std::size_t lengthOfLine(std::string_view text, std::size_t room) {
    std::size_t characters = 0;
    std::size_t lastBlank = std::string_view::npos;
    for (std::size_t at = 0; at < text.size(); ++at) {
        const bool beginsCharacter = (static_cast<unsigned char>(text[at]) & 0xc0U) != 0x80U;
        if (beginsCharacter && characters == room) {
            return text[at] == ' ' || lastBlank == std::string_view::npos ? at : lastBlank;
        }
        characters += beginsCharacter ? 1 : 0;
        lastBlank = text[at] == ' ' && at > 0 ? at : lastBlank;
    }
    return text.size();
}

/// The text in lines of at most `room` characters behind the indent.
std::string folded(std::string_view text, std::size_t room) {
    std::string lines;
    while (!text.empty()) {
        const std::size_t length = lengthOfLine(text, room - kIndent.size());
        lines += base::concat(kIndent, text.substr(0, length), '\n');
        text.remove_prefix(length);
        text.remove_prefix(text.starts_with(' ') ? 1 : 0);
    }
    return lines;
}

/// The first `columns` texts of the row, all of them printable.
std::string sideBySide(const Row& row, const std::vector<std::size_t>& widths,
                       std::size_t columns) {
    std::string line;
    std::size_t missing = 0;
    for (std::size_t column = 0; column < columns; ++column) {
        if (!row[column].empty()) {
            line += std::string(missing, ' ');
            line += row[column];
            missing = 0;
        }
        missing += widths[column] - characterCount(row[column]) + kBetweenColumns;
    }
    return line;
}

Row printableRow(const Row& row) {
    Row texts(row.size());
    std::transform(row.begin(), row.end(), texts.begin(),
                   [](const std::string& text) { return printable(text); });
    return texts;
}

} // namespace

std::string textForm(const Report& report, Colours colours) {
    Writer writer(colours);
    writer.write(report, 0);
    return writer.take();
}

Table::Table(Row headings, std::optional<std::size_t> room)
    : headings_(std::move(headings)),
      room_(room ? std::optional(std::max(*room, kLeastRoom)) : room),
      widths_(headings_.size()) {
    measure(headings_);
}

void Table::measure(const Row& row) {
    for (std::size_t column = 0; column < widths_.size(); ++column) {
        widths_[column] = std::max(widths_[column], characterCount(printable(row[column])));
    }
}

std::size_t Table::columnsSideBySide() const {
    std::size_t columns = 0;
    std::size_t needed = 0;
    while (columns < widths_.size()) {
        needed += widths_[columns] + (columns > 0 ? kBetweenColumns : 0);
        if (room_ && needed > *room_) {
            break;
        }
        ++columns;
    }
    return columns;
}

std::string Table::headingLines(Colours colours) const {
    const std::string text = lines(headings_);
    return base::concat(coloured(text.substr(0, text.size() - 1), kBold, colours), '\n');
}

std::string Table::lines(const Row& row) const {
    const Row texts = printableRow(row);
    const std::size_t columns = columnsSideBySide();
    std::string text =
        columns > 0 ? base::concat(sideBySide(texts, widths_, columns), '\n') : std::string();
    for (std::size_t column = columns; column < texts.size(); ++column) {
        text += folded(texts[column], *room_);
    }
    return text;
}

std::string tabbedLine(const Row& row) {
    std::string line;
    for (const std::string& text : row) {
        line += &text == &row.front() ? "" : "\t";
        line += printable(text);
    }
    return line + '\n';
}

} // namespace kstctl
