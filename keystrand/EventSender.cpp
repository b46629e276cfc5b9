#include "keystrand/EventSender.h"

#include "base/UnixAddress.h"
#include "wire/EventDatagram.h"

#include <cerrno>
#include <chrono>
#include <ctime>
#include <optional>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <utility>

namespace keystrand {

namespace {

constexpr std::chrono::milliseconds kResendDelay{200};

/// Connected, because only a connected socket can be waited for until its peer has room.
base::FileDescriptor connectTo(const std::string& path) {
    const auto address = base::UnixAddress::of(path);
    base::FileDescriptor fd(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!address || !fd.isOpen() || ::connect(fd.get(), address->get(), address->size()) != 0) {
        return {};
    }
    return fd;
}

enum class SendResult { sent, full, gone };

SendResult sendDatagram(int fd, const std::vector<std::uint8_t>& datagram) {
    for (;;) {
        if (::send(fd, datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            return SendResult::sent;
        }
        if (errno != EINTR) {
            return errno == EAGAIN || errno == ENOBUFS ? SendResult::full : SendResult::gone;
        }
    }
}

} // namespace

EventSender::EventSender(EventLoop& loop, std::string path)
    : loop_(loop), path_(std::move(path)), retry_(loop.timer(CLOCK_MONOTONIC, [this] {
          waiting_ = false;
          sendQueued();
      })) {}

bool EventSender::post(std::string_view stream, std::string_view name) {
    auto datagram = wire::encodeEvent(stream, name);
    if (!datagram) {
        return false;
    }
    if (queue_.size() == kMaxQueued) {
        ++refused_;
        return false;
    }
    queue_.push_back(std::move(*datagram));
    if (!waiting_) {
        sendQueued();
    }
    return true;
}

void EventSender::sendQueued() {
    bool mayReconnect = true;
    while (!queue_.empty()) {
        if (!connectToPresentFile()) {
            waitForRoom();
            return;
        }
        switch (sendDatagram(fd_.get(), queue_.front())) {
        case SendResult::sent:
            queue_.pop_front();
            ++sent_;
            mayReconnect = true;
            break;
        case SendResult::full:
            waitForRoom();
            return;
        case SendResult::gone:
            // The file may already be another owner's, even under the same inode number.
            disconnect();
            if (!std::exchange(mayReconnect, false)) {
                waitForRoom();
                return;
            }
            break;
        }
    }
}

bool EventSender::connectToPresentFile() {
    struct stat present {};
    if (::stat(path_.c_str(), &present) != 0) {
        disconnect();
        return false;
    }
    if (fd_.isOpen() && present.st_dev == device_ && present.st_ino == inode_) {
        return true;
    }
    disconnect();
    base::FileDescriptor fd = connectTo(path_);
    struct stat connected {};
    if (!fd.isOpen() || ::stat(path_.c_str(), &connected) != 0 ||
        connected.st_dev != present.st_dev || connected.st_ino != present.st_ino) {
        return false;
    }
    fd_ = std::move(fd);
    device_ = present.st_dev;
    inode_ = present.st_ino;
    writable_ = loop_.watch(fd_.get(), 0, [this](std::uint32_t /*events*/) {
        writable_.disable();
        waiting_ = false;
        sendQueued();
    });
    writable_.disable();
    return true;
}

void EventSender::disconnect() {
    writable_ = EventSource();
    fd_.reset();
}

/// Goes on when the socket is writable, and looks again after a while in any case: a full socket
/// may have been replaced by another file.
void EventSender::waitForRoom() {
    waiting_ = true;
    if (fd_.isOpen()) {
        writable_.listenFor(EPOLLOUT);
    }
    retry_.expireIn(kResendDelay);
}

} // namespace keystrand
