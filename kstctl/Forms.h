#pragma once

#include "kstctl/Report.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kstctl {

enum class Colours { no, yes };

/// A report for people: a line "name: value (meaning)" for each field, what lies deeper indented by
/// two blanks, a list's elements behind hyphens. Every text is printable.
[[nodiscard]] std::string textForm(const Report& report, Colours colours);

/// The report as one compact JSON object and a newline.
///
/// None and Unknown are null. Beside a field `x` stands `xText` with its meaning, if it has one,
/// and `xUnknown` with the reason, if it is unknown. A text that is not UTF-8 is made printable. A
/// real number that is not finite is null.
[[nodiscard]] std::string JSONForm(const Report& report);

/// The JSON object of a report whose last value is a list, made piece by piece.
class JSONListForm {
  public:
    /// `head` is what stands before the list, `name` is the list's.
    JSONListForm(const Report& head, std::string_view name);

    /// What comes before the first element.
    [[nodiscard]] const std::string& start() const { return start_; }
    /// The next element.
    [[nodiscard]] std::string element(const Report& report);
    /// What comes behind the last one.
    [[nodiscard]] static std::string end() { return "]}\n"; }

  private:
    std::string start_;
    bool isFirst_ = true;
};

/// A text as it stands inside a string of JSON.
[[nodiscard]] std::string JSONTextForm(std::string_view text);

using Row = std::vector<std::string>;

/// Rows of texts under headings, in columns as wide as their widest text with two blanks between
/// them, and none at the end of a line.
///
/// Where a line has less room the columns that fit stand side by side, and each of the others has
/// lines of its own below them, two blanks further right.
class Table {
  public:
    /// `room` is how many characters fit into a line; none is as many as it takes.
    Table(Row headings, std::optional<std::size_t> room);

    /// Widens the columns for the row. All rows come here before the first line is made.
    void measure(const Row& row);

    [[nodiscard]] std::string headingLines(Colours colours) const;
    [[nodiscard]] std::string lines(const Row& row) const;

  private:
    [[nodiscard]] std::size_t columnsSideBySide() const;

    Row headings_;
    std::optional<std::size_t> room_;
    std::vector<std::size_t> widths_;
};

/// The row in one line, with a tab between two texts.
[[nodiscard]] std::string tabbedLine(const Row& row);

/// The text as a terminal may be shown it. Whatever could move the cursor, hide or reorder what is
/// shown (control characters of either set, line separators, marks of writing direction) and every
/// byte that is no part of UTF-8 becomes an escape: \n, \r, \t, \xNN for a byte, \u{N} for a
/// character. A backslash is doubled, so that two texts never look the same.
[[nodiscard]] std::string printable(std::string_view text);

/// A JSON text in which such characters are escaped in the way of JSON.
[[nodiscard]] std::string printableJSON(std::string_view json);

/// How many characters a printable text has.
[[nodiscard]] std::size_t characterCount(std::string_view printable);

} // namespace kstctl
