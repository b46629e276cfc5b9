#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "common/Failure.h"
#include "tests/support/AssertionLines.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/StandardOutputCapture.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

namespace support {

/// A library that writes to `log`, with standard output captured; nothing may be left allocated at
/// the end.
class LibraryFixture : public testing::Test {
  protected:
    void SetUp() override {
        kst::setLibraryLog(&log);
        output.emplace();
    }

    void TearDown() override {
        output.reset();
        kst::setLibraryLog(nullptr);
        EXPECT_EQ(gAllocatedBytes, allocatedBefore_);
    }

    /// The lines in the log, with <n> for the line number of an assertion line.
    [[nodiscard]] std::vector<std::string> logged() const { return textsWithoutLineNumbers(log); }

    /// A failed check of the library, as `logged` shows it.
    static std::string failedCheck(const std::string& condition, const std::string& value = "0x0") {
        return "KSTLib: AssertMacros: " + condition + " (value: " + value +
               "),  file: KSTLib/KSTLib:<n>\n";
    }

    /// The line of a LibCall function of `source`, "LibCall" or "LibCallBlock", whose transport
    /// returned `status`, as `logged` shows it.
    static std::string transportFailed(std::int32_t status, const std::string& source) {
        std::ostringstream line;
        line << "KST: AssertMacros: err == 0  (value: 0x" << std::hex << std::int64_t{status}
             << "),  file: common/" << source << ":<n>\n";
        return line.str();
    }

    [[nodiscard]] std::string printed() const { return output->text(); }

    RecordingLog log;
    std::optional<StandardOutputCapture> output;

  private:
    std::int64_t allocatedBefore_ = gAllocatedBytes;
};

} // namespace support
