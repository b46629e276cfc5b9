#pragma once

#include "KSTLib/Status.h"
#include "common/Failure.h"

#include <cstdint>

/// What the public functions of the library write: a line on entry and one on exit, each shown only
/// when its severity is not below the library's log level.
namespace kst {

inline constexpr std::uint8_t kInitialLogLevel = 40;

/// The severity of entries and successful returns, and of failed returns.
inline constexpr std::uint8_t kTraceSeverity = 30;
inline constexpr std::uint8_t kFailureSeverity = 70;

/// The library's log level.
extern std::uint8_t gLogLevel;

[[nodiscard]] inline bool isShown(std::uint8_t severity) noexcept {
    return severity >= gLogLevel;
}

/// "KSTLib: <function>: called."
void logCalled(const char* function) noexcept;

/// "KSTLib: <function>: returning, err = <status>." Hands `status` back.
KSTStatus logReturning(const char* function, KSTStatus status) noexcept;

/// "KSTLib: <function>: returning.", for a function without a result.
void logReturning(const char* function) noexcept;

/// "KSTLib: <function>: returning, ref = <reference>.", for a function whose result is a reference;
/// `status` is how it ended.
void logReturningReference(const char* function, KSTStatus status, const void* reference) noexcept;

/// "KSTLib: <function>: log level set to <level>."
void logLevelSet(const char* function) noexcept;

} // namespace kst
