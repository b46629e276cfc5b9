#pragma once

#include <string>
#include <string_view>

namespace platform {

/// What a managed-settings file says.
///
/// The file is lines of `key = value`; blanks and tabs around either do not matter. A key consists
/// of lower-case letters, digits and hyphens. Empty lines and lines that begin with `#` say
/// nothing. The one key known here is `restricted-mode-allowed`, with the value `yes` or `no`,
/// given at most once; it is `yes` when it is not given.
struct ManagedSettingsText {
    bool restrictedModeAllowed = true;
    /// The first thing that is wrong with the file, empty when nothing is. The file then counts for
    /// nothing: `restrictedModeAllowed` is true.
    std::string problem;
    /// What is odd but harms nothing: the first key that is not known and how many there are.
    /// Empty when there is none.
    std::string remark;
};

[[nodiscard]] ManagedSettingsText parseManagedSettings(std::string_view text);

} // namespace platform
