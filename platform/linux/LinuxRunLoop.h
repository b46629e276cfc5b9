#pragma once

#include "base/NotCopied.h"
#include "platform/MainRunLoop.h"
#include "platform/SystemLog.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

struct sd_event;
struct sd_event_source;

namespace platform {

class LinuxRunLoop;

/// One thing that a run loop waits for; it stops waiting when this is destroyed, which the handler
/// itself may do. Main thread only, and the run loop outlives it.
class RunLoopSource : private base::NotCopied {
  public:
    using Handler = std::function<void()>;
    /// Whether the loop has a reason to run while the source is enabled.
    enum class Keeps { loopRunning, nothing };

    ~RunLoopSource();

    void setEnabled(bool enabled);

    /// For a timer: enables it to fire once, `delay` from now.
    void fireAfter(std::chrono::microseconds delay);

  private:
    friend class LinuxRunLoop;

    RunLoopSource(LinuxRunLoop& loop, Keeps keeps, Handler handler);
    void countAs(bool enabled);
    static int dispatch(void* self);

    LinuxRunLoop& loop_;
    Handler handler_;
    Keeps keeps_;
    bool enabled_ = false;
    sd_event_source* source_ = nullptr;
};

/// MainRunLoop on sd-event. The sources that it is given count as sources of the loop while they
/// are enabled, except for urgent ones, and timers that are not said to.
///
/// A handler that throws ends the loop, with a line that says what: it runs no more.
class LinuxRunLoop final : public MainRunLoop {
  public:
    explicit LinuxRunLoop(SystemLog& log);
    ~LinuxRunLoop() override;

    [[nodiscard]] bool runOnce(Date deadline) override;

    /// Whether it has ended because it could not go on, and not for want of sources.
    [[nodiscard]] bool hasFailed() const { return hasFailed_; }

    /// Calls `handler` whenever `descriptor` is readable. Enabled from the start. The descriptor
    /// stays the caller's and must be open for as long as the source lives.
    [[nodiscard]] std::unique_ptr<RunLoopSource> addReadable(int descriptor,
                                                             RunLoopSource::Handler handler);

    /// As addReadable, but ahead of everything else that is ready, and no reason for the loop to
    /// run.
    [[nodiscard]] std::unique_ptr<RunLoopSource> addUrgent(int descriptor,
                                                           RunLoopSource::Handler handler);

    /// Calls `handler` in every turn of the loop in which it is enabled, before any descriptor is
    /// looked at. Disabled at first.
    [[nodiscard]] std::unique_ptr<RunLoopSource> addPending(RunLoopSource::Handler handler);

    /// A timer on the clock that setting the time does not move. Disabled at first.
    [[nodiscard]] std::unique_ptr<RunLoopSource>
    addTimer(RunLoopSource::Handler handler,
             RunLoopSource::Keeps keeps = RunLoopSource::Keeps::nothing);

  private:
    friend class RunLoopSource;

    [[nodiscard]] std::unique_ptr<RunLoopSource>
    addDescriptor(int descriptor, RunLoopSource::Keeps keeps, RunLoopSource::Handler handler);

    void fail(std::string_view reason);

    SystemLog& log_;
    sd_event* event_ = nullptr;
    int liveSources_ = 0;
    bool hasFailed_ = false;
};

} // namespace platform
