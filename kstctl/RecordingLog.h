#pragma once

#include "platform/SystemLog.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kstctl {

/// Keeps what the product's own code says about what it reads, so that it can be shown with the
/// result. One thread only.
class RecordingLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        lines_.emplace_back(text.substr(0, text.find_last_not_of('\n') + 1));
    }

    [[nodiscard]] const std::vector<std::string>& lines() const { return lines_; }

  private:
    std::vector<std::string> lines_;
};

} // namespace kstctl
