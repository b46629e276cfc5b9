#pragma once

#include "base/NotCopied.h"

#include <functional>
#include <list>
#include <mutex>
#include <thread>

namespace platform {

/// A thread for each request of a session, which takes no signals: those of the process are for its
/// main thread, and that of a broken connection must not end it. Those that have ended are joined
/// when the next one starts. Any thread may start one, work of a request included.
class RequestThreads : private base::NotCopied {
  public:
    /// Waits for the end of all. Not from one of them.
    ~RequestThreads();

    /// False when no thread can be made; the work is then not run. What the work holds is
    /// destroyed before its thread ends.
    [[nodiscard]] bool start(std::function<void()> work);

  private:
    struct Request {
        std::thread thread;
        bool ended = false;
    };

    void run(std::list<Request>::iterator request, std::function<void()> work);
    [[nodiscard]] std::list<Request> takeEnded();
    static void join(std::list<Request> requests);

    std::mutex mutex_;
    std::list<Request> requests_;
};

} // namespace platform
