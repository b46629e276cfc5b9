#include "keystrand-sim/ControlSocket.h"

#include "base/Concat.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace keystrand::sim {

ControlConnection::ControlConnection(EventLoop& loop, base::FileDescriptor fd, Handlers handlers)
    : fd_(std::move(fd)),
      handlers_(std::move(handlers)),
      source_(loop.watch(fd_.get(), EPOLLIN, [this](std::uint32_t events) { onReady(events); })),
      timeout_(loop.timer(CLOCK_MONOTONIC, [this] { onTimeout(); })) {}

void ControlConnection::checkWait() {
    if (wait_ && handlers_.isMet(*wait_)) {
        finishWait(ControlOutcome::done());
    }
}

void ControlConnection::onTimeout() {
    finishWait(ControlOutcome::failed("timeout"));
}

void ControlConnection::finishWait(const ControlOutcome& outcome) {
    wait_.reset();
    timeout_.disable();
    answer(outcome);
    endUnless(proceed());
}

void ControlConnection::onReady(std::uint32_t events) {
    if ((events & EPOLLIN) != 0) {
        endUnless(receive() && proceed());
    } else if ((events & EPOLLOUT) != 0) {
        endUnless(proceed());
    } else {
        endUnless(false);
    }
}

bool ControlConnection::receive() {
    std::array<char, 4096> buffer{};
    const ssize_t size = ::recv(fd_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (size < 0) {
        return errno == EAGAIN || errno == EINTR;
    }
    // The lines before the end are carried out all the same.
    inputEnded_ = size == 0;
    input_.append(buffer.data(), static_cast<std::size_t>(size));
    return true;
}

bool ControlConnection::proceed() {
    do {
        if (!sendOutput()) {
            return false;
        }
        // A client that does not read its answers gets no more of them, and none pile up here.
        if (!output_.empty()) {
            source_.listenFor(EPOLLOUT);
            return true;
        }
    } while (runNextLine());
    if (wait_) {
        // A hang-up is heard even so.
        source_.listenFor(0);
        return true;
    }
    source_.listenFor(EPOLLIN);
    return !inputEnded_;
}

bool ControlConnection::runNextLine() {
    if (wait_) {
        return false;
    }
    const std::size_t length = input_.find('\n');
    if (std::min(length, input_.size()) > kMaxLineLength) {
        answer(ControlOutcome::failed("line too long"));
        input_.clear();
        inputEnded_ = true;
        return true;
    }
    if (length == std::string::npos) {
        return false;
    }
    const std::string line = input_.substr(0, length);
    input_.erase(0, length + 1);
    runLine(line);
    return true;
}

void ControlConnection::runLine(std::string_view line) {
    const ControlOutcome outcome = handlers_.run(line);
    if (outcome.wait && !handlers_.isMet(*outcome.wait)) {
        wait_ = outcome.wait;
        timeout_.expireIn(wait_->timeout);
        return;
    }
    answer(outcome);
    if (outcome.quit) {
        // The answer must be on its way before the loop ends.
        static_cast<void>(sendOutput());
        handlers_.quit();
    }
}

void ControlConnection::answer(const ControlOutcome& outcome) {
    for (const std::string& line : outcome.lines) {
        output_ += line;
        output_ += '\n';
    }
    output_ += outcome.error.empty() ? "ok\n" : base::concat("error ", outcome.error, '\n');
}

bool ControlConnection::sendOutput() {
    while (outputSent_ < output_.size()) {
        const ssize_t size = ::send(fd_.get(), output_.data() + outputSent_,
                                    output_.size() - outputSent_, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (size < 0) {
            return errno == EAGAIN || errno == EINTR || errno == ENOBUFS;
        }
        outputSent_ += static_cast<std::size_t>(size);
    }
    output_.clear();
    outputSent_ = 0;
    return true;
}

void ControlConnection::endUnless(bool alive) const {
    if (!alive) {
        // It destroys this connection, and so must not be called where it is kept.
        const auto ended = handlers_.ended;
        ended();
    }
}

ControlSocket::ControlSocket(EventLoop& loop, ListeningSocket socket, const ControlContext& context)
    : loop_(loop),
      context_(context),
      connections_(loop, std::move(socket), kMaxConnections,
                   [this](base::FileDescriptor fd, Table::Ended ended) {
                       return serve(std::move(fd), std::move(ended));
                   }) {
    context_.requests.setObserver([this] {
        connections_.forEach([](ControlConnection& connection) { connection.checkWait(); });
    });
}

std::unique_ptr<ControlConnection> ControlSocket::serve(base::FileDescriptor fd,
                                                        Table::Ended ended) {
    return std::make_unique<ControlConnection>(
        loop_, std::move(fd),
        ControlConnection::Handlers{
            .run = [this](std::string_view line) { return runControlLine(context_, line); },
            .isMet = [this](const WaitCondition& wait) { return wait.isMet(context_.requests); },
            .quit = [this] { loop_.stop(); },
            .ended = std::move(ended)});
}

} // namespace keystrand::sim
