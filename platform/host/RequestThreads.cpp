#include "platform/host/RequestThreads.h"

#include "base/NotCopied.h"

#include <csignal>
#include <iterator>
#include <malloc.h>
#include <system_error>
#include <utility>

namespace platform {

namespace {

/// Threads made while this lasts take no signals.
class SignalsBlocked : private base::NotCopied {
  public:
    SignalsBlocked() {
        sigset_t all;
        ::sigfillset(&all);
        ::pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    ~SignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &before_, nullptr); }

  private:
    sigset_t before_{};
};

} // namespace

RequestThreads::~RequestThreads() {
    // A request may start another one until it has ended.
    for (;;) {
        std::list<Request> requests;
        {
            const std::lock_guard lock(mutex_);
            if (requests_.empty()) {
                return;
            }
            requests.splice(requests.end(), requests_);
        }
        join(std::move(requests));
    }
}

bool RequestThreads::start(std::function<void()> work) {
    join(takeEnded());
    const std::lock_guard lock(mutex_);
    const auto request = requests_.emplace(requests_.end());
    const SignalsBlocked blocked;
    // An arena for each thread takes memory that may not be had; then nothing could be allocated in
    // it, not even what says so.
    ::mallopt(M_ARENA_MAX, 1);
    try {
        request->thread = std::thread(
            [this, request, work = std::move(work)]() mutable { run(request, std::move(work)); });
    } catch (const std::system_error&) {
        requests_.erase(request);
        return false;
    }
    return true;
}

void RequestThreads::run(std::list<Request>::iterator request, std::function<void()> work) {
    work();
    work = nullptr;
    const std::lock_guard lock(mutex_);
    request->ended = true;
}

std::list<RequestThreads::Request> RequestThreads::takeEnded() {
    const std::lock_guard lock(mutex_);
    std::list<Request> ended;
    for (auto request = requests_.begin(); request != requests_.end();) {
        const auto next = std::next(request);
        if (request->ended) {
            ended.splice(ended.end(), requests_, request);
        }
        request = next;
    }
    return ended;
}

void RequestThreads::join(std::list<Request> requests) {
    for (Request& request : requests) {
        request.thread.join();
    }
}

} // namespace platform
