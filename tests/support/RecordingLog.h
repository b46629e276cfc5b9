#pragma once

#include "platform/SystemLog.h"

#include <string>
#include <string_view>
#include <vector>

namespace support {

/// A log that keeps what it is given, byte for byte.
class RecordingLog : public platform::SystemLog {
  public:
    struct Line {
        platform::LogLevel level;
        std::string text;
        std::string file;
        int line;
        std::string function;
    };

    RecordingLog();
    ~RecordingLog() override;

    void write(platform::LogLevel level, std::string_view text,
               const platform::LogFields& fields) override;

    [[nodiscard]] const std::vector<Line>& lines() const { return lines_; }
    [[nodiscard]] std::vector<std::string> texts() const;

    void clear() { lines_.clear(); }

  private:
    std::vector<Line> lines_;
};

} // namespace support
