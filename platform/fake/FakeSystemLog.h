#pragma once

#include "platform/SystemLog.h"

#include <mutex>
#include <string>
#include <vector>

namespace platform {

/// A log that keeps its lines.
class FakeSystemLog final : public SystemLog {
  public:
    struct Line {
        LogLevel level = LogLevel::info;
        /// As the log shows it: without its final newline, control characters escaped.
        std::string text;
        std::string file;
        int line = 0;
        std::string function;
        std::string messageId;
    };

    void write(LogLevel level, std::string_view text, const LogFields& fields) override;

    [[nodiscard]] std::vector<Line> lines() const;
    [[nodiscard]] std::vector<std::string> texts() const;

    void clear();

  private:
    mutable std::mutex mutex_;
    std::vector<Line> lines_;
};

} // namespace platform
