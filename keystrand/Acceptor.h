#pragma once

#include "base/FileDescriptor.h"
#include "keystrand/EventLoop.h"
#include "keystrand/ListeningSocket.h"

#include <functional>

namespace keystrand {

/// Takes connections from a listening socket and hands over those of trusted peers; any other is
/// closed without a word. While it is paused, connections wait in the socket's queue.
class Acceptor {
  public:
    using Handler = std::function<void(base::FileDescriptor connection)>;

    /// The loop outlives it.
    Acceptor(EventLoop& loop, ListeningSocket socket, Handler handler);

    void pause();
    void resume();

  private:
    void accept();

    ListeningSocket socket_;
    Handler handler_;
    EventSource source_;
    /// Runs when the system had no room for one more connection.
    EventSource retry_;
};

} // namespace keystrand
