#pragma once

#include "kstctl/Report.h"

#include <string>
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

/// Rows of texts under headings.
struct Table {
    std::vector<std::string> headings;
    std::vector<std::vector<std::string>> rows;
};

/// Columns as wide as their widest text, two blanks between them, none at the end of a line.
[[nodiscard]] std::string textForm(const Table& table, Colours colours);

/// One line for each row, the headings first, with a tab between two texts.
[[nodiscard]] std::string tabbedForm(const Table& table);

} // namespace kstctl
