#pragma once

#include "base/NotCopied.h"

#include <string_view>

namespace platform {

/// Whether a machine is one of the developers' own.
class InternalDiagnostics : private base::NotCopied {
  public:
    virtual ~InternalDiagnostics() = default;

    [[nodiscard]] virtual bool isEnabled(std::string_view subsystem) = 0;
};

} // namespace platform
