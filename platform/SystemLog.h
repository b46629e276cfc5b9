#pragma once

#include "base/NotCopied.h"

#include <string_view>

namespace platform {

enum class LogLevel { debug, info, notice, warning, error };

/// What a line has beside its text: where in the code it comes from, and its class. Empty or 0
/// means not known, or none.
struct LogFields {
    std::string_view file = {};
    int line = 0;
    std::string_view function = {};
    /// The identifier of one of the classes in MessageClasses.h.
    std::string_view messageId = {};
};

/// The system's log.
///
/// One call writes one line. One newline at the end of the text is dropped. What could break, forge
/// or turn round a line is shown as an escape: control characters (\n, \t, \xNN, \u{85}), line
/// separators and bidirectional controls (\u{202e}), and bytes that are not UTF-8 (\xNN). Writing
/// never fails as far as the caller can see, and leaves errno alone.
///
/// May be called from any thread.
class SystemLog : private base::NotCopied {
  public:
    virtual ~SystemLog() = default;

    virtual void write(LogLevel level, std::string_view text, const LogFields& fields) = 0;
};

} // namespace platform
