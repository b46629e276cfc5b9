#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-sim/ControlCommand.h"
#include "keystrand-sim/ControlSocket.h"
#include "keystrand-sim/FaultScript.h"
#include "keystrand-sim/FaultyRequestHandler.h"
#include "keystrand-sim/RequestLog.h"
#include "keystrand/Commands.h"
#include "keystrand/EventLoop.h"
#include "keystrand/EventSender.h"
#include "keystrand/KernelSocketServer.h"
#include "keystrand/ListeningSocket.h"
#include "keystrand/NotificationPublisher.h"
#include "keystrand/RestrictedModeController.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace keystrand::sim {

/// The kernel side as a whole, under one root directory.
class Simulator {
  public:
    struct Settings {
        std::string root = "/";
        RestrictedModeTimer::Periods periods;
        /// Where a manual clock stands; none for the real one.
        std::optional<RestrictedModeTimer::Seconds> clock;
        std::uint8_t logLevel = 40;
        bool quiet = false;
        /// The file with the policies; empty for no policies.
        std::string policies = {};
    };

    /// A simulator whose sockets listen, or none with a reason for people in `error`. It serves
    /// `activated`, a listening socket that does not block, in the place of a kernel socket of its
    /// own; a closed descriptor when there is none.
    [[nodiscard]] static std::unique_ptr<Simulator>
    create(const Settings& settings, base::FileDescriptor activated, std::string& error);

    /// Serves until SIGTERM, SIGINT or the control command that ends it. False when the loop
    /// failed.
    [[nodiscard]] bool run();

  private:
    Simulator(const Settings& settings, PolicyTable policies, std::unique_ptr<EventLoop> loop,
              ListeningSocket service, ListeningSocket control);
    void armDeadline();

    std::unique_ptr<EventLoop> loop_;
    KernelState kernel_;
    FaultScript faults_;
    RequestLog requests_;
    EventSender events_;
    ManualClock clock_;
    NotificationPublisher publisher_;
    RestrictedModeController restrictedMode_;
    DispatchTable kernelControls_;
    DispatchTable commands_;
    FaultyRequestHandler handler_;
    KernelSocketServer server_;
    ControlSocket control_;
    EventSource deadline_;
    EventSource terminate_;
    EventSource interrupt_;
};

} // namespace keystrand::sim
