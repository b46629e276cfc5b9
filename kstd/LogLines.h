#pragma once

#include "base/Concat.h"
#include "platform/FailedCheck.h"
#include "platform/SystemLog.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace kstd {

inline constexpr char kTag[] = "kstd";

/// More than any log shows of a line.
inline constexpr std::size_t kLogLineRoom = 9000;

/// Writes "kstd: <function>: " and the joined parts, at info level, as a line of the class
/// `messageId`. Nothing is allocated, so that a failure for want of memory can be told.
template <typename... Parts>
void logLineOfClass(platform::SystemLog& log, std::string_view messageId, std::string_view function,
                    const Parts&... message) {
    base::BoundedText<kLogLineRoom> line;
    const auto add = [&line](const auto&... parts) {
        (base::append(line, parts), ...);
    };
    add(kTag, ": ", function, ": ", message..., "\n");
    log.write(platform::LogLevel::info, line.view(),
              {.function = function, .messageId = messageId});
}

/// The same for a line that is of no class.
template <typename... Parts>
void logLine(platform::SystemLog& log, std::string_view function, const Parts&... message) {
    logLineOfClass(log, {}, function, message...);
}

/// A log that hands every line on, and makes those that begin as it was told lines of a class: for
/// what is written by code that cannot know of the daemon's classes.
class ClassifyingLog final : public platform::SystemLog {
  public:
    /// `log` must outlive it.
    ClassifyingLog(platform::SystemLog& log, std::string_view messageId,
                   std::string_view beginning = {})
        : log_(log), messageId_(messageId), beginning_(beginning) {}

    void write(platform::LogLevel level, std::string_view text,
               const platform::LogFields& fields) override {
        platform::LogFields known = fields;
        if (text.starts_with(beginning_)) {
            known.messageId = messageId_;
        }
        log_.write(level, text, known);
    }

  private:
    platform::SystemLog& log_;
    std::string_view messageId_;
    std::string_view beginning_;
};

} // namespace kstd
