#pragma once

#include <string_view>

namespace platform {

/// What a class of log lines looks like. The log gives a line of a class the class's identifier, by
/// which it is found in the journal and explained by the journal's catalog.
struct MessageClass {
    /// 32 lower-case hexadecimal digits.
    std::string_view id;
    /// How a line of the class begins. An asterisk stands for any text.
    std::string_view pattern;
};

} // namespace platform
