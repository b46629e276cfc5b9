#pragma once

#include <string_view>

namespace platform {

/// Whether a machine is one of the developers' own.
class InternalDiagnostics {
  public:
    InternalDiagnostics() = default;
    InternalDiagnostics(const InternalDiagnostics&) = delete;
    InternalDiagnostics& operator=(const InternalDiagnostics&) = delete;
    virtual ~InternalDiagnostics() = default;

    [[nodiscard]] virtual bool isEnabled(std::string_view subsystem) = 0;
};

} // namespace platform
