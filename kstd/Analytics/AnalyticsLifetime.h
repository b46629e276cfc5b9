#pragma once

namespace kstd {

/// The time in which analytics may use the host. A program holds one from before its first event to
/// after its last, and ends it before the host.
///
/// The loggers, their stores and the cached system version are there once in a process and refer to
/// the host; the end of the lifetime releases them. A logger that somebody still holds then goes
/// with its last holder.
class AnalyticsLifetime {
  public:
    AnalyticsLifetime() = default;
    AnalyticsLifetime(const AnalyticsLifetime&) = delete;
    AnalyticsLifetime& operator=(const AnalyticsLifetime&) = delete;
    ~AnalyticsLifetime();
};

} // namespace kstd
