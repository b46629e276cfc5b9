#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-linux/GateConfiguration.h"
#include "keystrand-linux/GateSocket.h"
#include "keystrand-linux/Keystrand.h"
#include "keystrand-linux/MachineSwitches.h"
#include "keystrand-linux/SessionsSocket.h"
#include "keystrand-linux/SysfsUsbBus.h"
#include "keystrand-linux/SystemClocks.h"
#include "keystrand/EventSender.h"
#include "keystrand/KernelSocketServer.h"
#include "keystrand/Timers.h"

#include <memory>
#include <string>

namespace keystrand::usb {

/// Keystrand for Linux as a whole, under one root directory.
class KeystrandService {
  public:
    /// A service whose sockets listen, or none with a reason for people in `error`. It serves
    /// `activated`, a listening socket that does not block, in the place of a kernel socket of its
    /// own; a closed descriptor when there is none. The log outlives it.
    [[nodiscard]] static std::unique_ptr<KeystrandService> create(const std::string& root,
                                                                  base::FileDescriptor activated,
                                                                  GateLog& log, std::string& error);

    /// Serves until SIGTERM or SIGINT. A closed gate stays closed. False when the loop failed.
    [[nodiscard]] bool run();

    /// Has the init system's watchdog, if it set one, watch the loop while that works, and not
    /// while it waits: nothing hangs then, and nothing has to wake up only to say so.
    static void watchWork(EventLoop& loop);

    enum class Restored : bool { whatWasClosed, all };
    /// Puts back what a service that is not there any more has written, and lets in what it
    /// refused, for as long as something of that may come late: ten seconds, or twenty when the
    /// kernel does not take it at once. Or opens all, whoever has closed it. False, with lines that
    /// say why, when something could not be opened.
    [[nodiscard]] static bool restore(const std::string& root, Restored what,
                                      const MachineClock& clock, GateLog& log);

  private:
    struct Sockets {
        ListeningSocket service;
        ListeningSocket gate;
        std::unique_ptr<LoopTimers> timers;
        std::unique_ptr<SessionsSocket> sessions;
    };

    KeystrandService(const std::string& root, GateLog& log, std::unique_ptr<EventLoop> loop,
                     KernelState kernel, bool hasPolicies, Sockets sockets);
    void arm();
    void stop();

    GateLog& log_;
    std::unique_ptr<EventLoop> loop_;
    std::unique_ptr<LoopTimers> timers_;
    std::unique_ptr<SessionsSocket> sessions_;
    KernelState kernel_;
    EventSender events_;
    SystemClocks clocks_;
    SysfsUsbBus bus_;
    StateFile record_;
    StateFile devices_;
    StateFile lastUsers_;
    MachineSwitches switches_;
    Keystrand keystrand_;
    DispatchTable commands_;
    RequestHandler handler_;
    KernelSocketServer server_;
    GateSocket gateSocket_;
    EventSource deadline_;
    DateWatch dateWatch_;
    EventSource terminate_;
    EventSource interrupt_;
};

} // namespace keystrand::usb
