#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace platform {

/// The value that a text in the form of os-release files gives to `name`, or none. The last
/// assignment counts.
///
/// A line is a comment when it begins with #, else an assignment as a shell has it: a value's parts
/// may stand in single or double quotes, a backslash takes the meaning from the character behind it
/// (in double quotes only from $, `, " and \), and after the value only a comment may follow.
/// Nothing is expanded and no value goes on in the next line. Every other line is skipped.
[[nodiscard]] std::optional<std::string> valueInOsRelease(std::string_view text,
                                                          std::string_view name);

} // namespace platform
