#include "kstd/Analytics/WaitForReply.h"

#include <atomic>
#include <memory>
#include <semaphore>
#include <utility>

namespace kstd {

namespace {

/// Lives as long as either side needs it. Only the first completion writes the reply, and it does
/// so before it releases the semaphore: afterwards the reply is the waiter's alone.
struct PendingReply {
    std::atomic_flag hasCome;
    platform::HTTPReply reply;
    std::binary_semaphore arrival{0};
};

} // namespace

platform::HTTPReply waitForReply(platform::HTTPSession& session,
                                 const platform::HTTPRequest& request) {
    const auto pending = std::make_shared<PendingReply>();
    session.start(request, [pending](const platform::HTTPReply& reply) {
        if (!pending->hasCome.test_and_set()) {
            pending->reply = reply;
            pending->arrival.release();
        }
    });
    pending->arrival.acquire();
    return std::move(pending->reply);
}

} // namespace kstd
