#include "tests/support/RecordingLog.h"

namespace support {

RecordingLog::RecordingLog() = default;
RecordingLog::~RecordingLog() = default;

void RecordingLog::write(platform::LogLevel level, std::string_view text,
                         const platform::LogFields& fields) {
    lines_.push_back({level, std::string(text), std::string(fields.file), fields.line,
                      std::string(fields.function)});
}

std::vector<std::string> RecordingLog::texts() const {
    std::vector<std::string> texts;
    for (const Line& line : lines_) {
        texts.push_back(line.text);
    }
    return texts;
}

} // namespace support
