#pragma once

#include "platform/InternalDiagnostics.h"

#include <functional>
#include <set>
#include <string>

namespace platform {

/// Diagnostics that a test switches on; all are off at first.
class FakeInternalDiagnostics final : public InternalDiagnostics {
  public:
    [[nodiscard]] bool isEnabled(std::string_view subsystem) override {
        return enabled_.contains(subsystem);
    }

    void enable(std::string_view subsystem) { enabled_.emplace(subsystem); }

    void disable(std::string_view subsystem) { enabled_.erase(std::string(subsystem)); }

  private:
    std::set<std::string, std::less<>> enabled_;
};

} // namespace platform
