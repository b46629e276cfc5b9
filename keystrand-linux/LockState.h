#pragma once

#include "base/NotCopied.h"

#include <functional>

namespace keystrand::usb {

/// Whether somebody uses the machine, as its sessions say. Everything happens on the thread of the
/// loop. Before anything is said the machine is locked.
///
/// The machine is unlocked while at least one of its seats is: somebody sits there who has logged
/// in and has not locked the screen. A seat at which nobody is logged in does not lock the others.
class LockState : private base::NotCopied {
  public:
    enum class Said {
        locked,
        /// Somebody has unlocked a session or logged in, or was heard of again who had: it may come
        /// when nothing else was said.
        unlocked,
        /// The machine goes to sleep as soon as `closed` is called, or some seconds from now. What
        /// is said meanwhile of sessions is kept for the time after.
        goingToSleep,
        /// Only after `goingToSleep`. Whether the machine is locked holds as it was said last.
        awake,
        /// Nothing can be said at present. What was said last holds. When that lasts a minute,
        /// `locked` follows.
        away,
    };
    using Listener = std::function<void(Said said)>;

    virtual ~LockState() = default;

    /// From now on the listener is called, never from within this call. There is one listener.
    virtual void listen(Listener listener) = 0;

    /// The answer to `goingToSleep`: nothing new comes in any more. At another time, nothing.
    virtual void closed() = 0;
};

} // namespace keystrand::usb
