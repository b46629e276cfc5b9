#include "wire/HTTPConnection.h"

#include <algorithm>
#include <cerrno>
#include <limits>
#include <poll.h>
#include <sys/socket.h>

namespace wire {

using State = HTTPConnectionState;

class HTTPConnection::Deadline {
  public:
    Deadline(Patience patience, std::optional<Clock::time_point> end) : end_(end) {
        if (patience) {
            const auto patient = Clock::now() + *patience;
            end_ = end_ ? std::min(*end_, patient) : patient;
        }
    }

    [[nodiscard]] bool hasPassed() const { return end_ && Clock::now() >= *end_; }

    /// What is left, as poll takes it; -1 is for ever.
    [[nodiscard]] int milliseconds() const {
        if (!end_) {
            return -1;
        }
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(*end_ - Clock::now());
        return static_cast<int>(
            std::clamp<std::int64_t>(left.count(), 0, std::numeric_limits<int>::max()));
    }

  private:
    std::optional<Clock::time_point> end_;
};

State HTTPConnection::awaitReady(short events, const Deadline& deadline) const {
    pollfd watched[2] = {{socket_.get(), events, 0}, {interrupt_, POLLIN, 0}};
    int ready = -1;
    do {
        ready = ::poll(watched, 2, deadline.milliseconds());
    } while (ready < 0 && errno == EINTR);
    if (ready < 0) {
        return State::hungUp;
    }
    if (ready == 0) {
        return State::timedOut;
    }
    // A hang-up, too: the call that follows tells of it.
    return watched[0].revents != 0 ? State::open : State::interrupted;
}

State HTTPConnection::send(std::span<const std::uint8_t> message) {
    return sendAll({message});
}

State HTTPConnection::sendPiece(std::span<const std::uint8_t> bytes) {
    const auto header =
        encodeHTTPHeader({HTTPMessageType::piece, static_cast<std::uint32_t>(bytes.size())});
    return sendAll({header, bytes});
}

State HTTPConnection::sendAll(std::initializer_list<std::span<const std::uint8_t>> parts) {
    const Deadline deadline(patience_, end_);
    for (std::span<const std::uint8_t> left : parts) {
        while (!left.empty()) {
            const ssize_t sent =
                ::send(socket_.get(), left.data(), left.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
            if (sent >= 0) {
                left = left.subspan(static_cast<std::size_t>(sent));
            } else if (errno == EAGAIN) {
                const State state = awaitReady(POLLOUT, deadline);
                if (state != State::open) {
                    return state;
                }
            } else if (errno != EINTR) {
                return State::hungUp;
            }
        }
    }
    return State::open;
}

State HTTPConnection::receive(HTTPMessage& message) {
    const Deadline deadline(patience_, end_);
    // Also when something has come: a peer that never stops sending is not listened to for ever.
    if (deadline.hasPassed()) {
        return State::timedOut;
    }
    HTTPHeaderBytes bytes{};
    State state = receiveAll(bytes, deadline);
    if (state != State::open) {
        return state;
    }
    const auto header = decodeHTTPHeader(bytes);
    if (!header) {
        return State::malformed;
    }
    fields_.resize(header->size);
    state = receiveAll(fields_, deadline);
    if (state == State::open) {
        message = {header->type, fields_};
    }
    return state;
}

State HTTPConnection::receiveAll(std::span<std::uint8_t> bytes, const Deadline& deadline) {
    while (!bytes.empty()) {
        const ssize_t received = ::recv(socket_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        if (received > 0) {
            bytes = bytes.subspan(static_cast<std::size_t>(received));
        } else if (received < 0 && errno == EAGAIN) {
            const State state = awaitReady(POLLIN, deadline);
            if (state != State::open) {
                return state;
            }
        } else if (received == 0 || errno != EINTR) {
            return State::hungUp;
        }
    }
    return State::open;
}

bool HTTPConnection::isHungUp() const {
    pollfd watched{socket_.get(), POLLRDHUP, 0};
    return ::poll(&watched, 1, 0) > 0;
}

} // namespace wire
