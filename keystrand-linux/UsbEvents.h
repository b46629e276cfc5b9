#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "keystrand/EventLoop.h"

#include <functional>
#include <string>
#include <string_view>

namespace keystrand::usb {

/// The socket at which the kernel tells of devices; not open, with a reason for people, where it
/// cannot be had. The process must see the machine's own users and network (not with PrivateUsers=
/// or PrivateNetwork=), else it hears nothing.
[[nodiscard]] base::FileDescriptor openKernelEvents(std::string& problem);

/// For a directory that only looks like sysfs: a socket of datagrams at that path, mode 0600, at
/// which whoever plays the kernel sends the same messages.
[[nodiscard]] base::FileDescriptor openEventsAt(const std::string& path, std::string& problem);

/// Whether the message says that something on a USB bus came, went, or got its driver, or that the
/// kernel has learned of USB, with its parameter, before there is any bus.
[[nodiscard]] bool tellsOfUsb(std::string_view message);

/// Hears of what comes and goes for as long as it exists. On a netlink socket only the kernel is
/// heard, not whoever else may send to it.
class UsbEvents : private base::NotCopied {
  public:
    struct Handlers {
        /// Something changed, once for all that was waiting, or events were lost. May destroy the
        /// object.
        std::function<void()> changed;
        /// Nothing will be heard any more, and why.
        std::function<void(const std::string& reason)> ended;
    };

    /// For a socket of datagrams that does not block. The loop outlives it. Whether the loop has
    /// taken the socket, `isHeard` says.
    UsbEvents(EventLoop& loop, base::FileDescriptor socket, Handlers handlers);

    [[nodiscard]] bool isHeard() const { return static_cast<bool>(source_); }

  private:
    enum class Heard { nothing, other, change, end };
    [[nodiscard]] Heard hear();
    void receive();
    void end(const std::string& reason);

    base::FileDescriptor socket_;
    Handlers handlers_;
    EventSource source_;
};

} // namespace keystrand::usb
