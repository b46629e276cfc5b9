#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "common/LibraryLog.h"
#include "tests/support/AssertionLines.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/StandardOutputCapture.h"

#include <gtest/gtest.h>

#include <optional>
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

    [[nodiscard]] std::string printed() const { return output->text(); }

    RecordingLog log;
    std::optional<StandardOutputCapture> output;

  private:
    std::int64_t allocatedBefore_ = gAllocatedBytes;
};

} // namespace support
