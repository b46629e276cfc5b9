#pragma once

#include "KSTLib/Handle.h"

namespace kstctl::decode {

/// Empty for a scope that does not exist.
[[nodiscard]] inline const char* scopeText(KSTScope scope) {
    switch (scope) {
    case kKSTScopeContext:
        return "context";
    case kKSTScopeGlobal:
        return "global";
    default:
        return "";
    }
}

} // namespace kstctl::decode
