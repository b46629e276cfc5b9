#include "platform/fake/FakeSystemLog.h"

#include "platform/host/LogText.h"

#include <algorithm>
#include <iterator>

namespace platform {

void FakeSystemLog::write(LogLevel level, std::string_view text, const LogFields& fields) {
    const std::lock_guard lock(mutex_);
    lines_.push_back({level, printableLine(text), std::string(fields.file), fields.line,
                      std::string(fields.function), std::string(fields.messageId)});
}

std::vector<FakeSystemLog::Line> FakeSystemLog::lines() const {
    const std::lock_guard lock(mutex_);
    return lines_;
}

std::vector<std::string> FakeSystemLog::texts() const {
    const std::lock_guard lock(mutex_);
    std::vector<std::string> texts;
    texts.reserve(lines_.size());
    std::transform(lines_.begin(), lines_.end(), std::back_inserter(texts),
                   [](const Line& line) { return line.text; });
    return texts;
}

void FakeSystemLog::clear() {
    const std::lock_guard lock(mutex_);
    lines_.clear();
}

} // namespace platform
