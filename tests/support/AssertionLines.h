#pragma once

#include "tests/support/RecordingLog.h"

#include <string>
#include <vector>

namespace support {

/// The texts of a log with the line number of each assertion line replaced by <n>, so that all else
/// can be compared exactly.
[[nodiscard]] std::vector<std::string> textsWithoutLineNumbers(const RecordingLog& log);

} // namespace support
