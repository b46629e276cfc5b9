#include "keystrand-sim/ControlClient.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"

#include <array>
#include <cerrno>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>
#include <utility>

namespace keystrand::sim {

namespace {

constexpr int kAttemptDistanceMilliseconds = 10;

/// A connected socket with the receive timeout set, or -1.
int tryConnect(const base::UnixAddress& address) {
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        return -1;
    }
    const timeval timeout{.tv_sec = ControlClient::kReceiveTimeout.count(), .tv_usec = 0};
    if (::setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout) == 0 &&
        ::connect(fd, address.get(), address.size()) == 0) {
        return fd;
    }
    ::close(fd);
    return -1;
}

} // namespace

std::optional<std::string> ControlClient::Answer::value(std::string_view key) const {
    for (const std::string& line : lines) {
        if (line.size() > key.size() && line.starts_with(key) && line[key.size()] == ' ') {
            return line.substr(key.size() + 1);
        }
    }
    return std::nullopt;
}

std::optional<ControlClient> ControlClient::connect(const std::string& path, int attempts) {
    const auto address = base::UnixAddress::of(path);
    for (int attempt = 0; address && attempt < attempts; ++attempt) {
        if (attempt > 0) {
            ::poll(nullptr, 0, kAttemptDistanceMilliseconds);
        }
        if (const int fd = tryConnect(*address); fd >= 0) {
            return ControlClient(fd);
        }
    }
    return std::nullopt;
}

ControlClient::ControlClient(ControlClient&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)), received_(std::move(other.received_)) {}

ControlClient& ControlClient::operator=(ControlClient&& other) noexcept {
    std::swap(fd_, other.fd_);
    std::swap(received_, other.received_);
    return *this;
}

ControlClient::~ControlClient() {
    hangUp();
}

ControlClient::Answer ControlClient::command(std::string_view line) {
    if (!send(line)) {
        return {.ok = false, .reason = "cannot send", .lines = {}};
    }
    return receive();
}

bool ControlClient::send(std::string_view line) {
    if (line.find('\n') != std::string_view::npos) {
        return false;
    }
    const std::string text = base::concat(line, '\n');
    for (std::size_t sent = 0; sent < text.size();) {
        const ssize_t size = ::send(fd_, text.data() + sent, text.size() - sent, MSG_NOSIGNAL);
        if (size < 0 && errno != EINTR) {
            hangUp();
            return false;
        }
        sent += size > 0 ? static_cast<std::size_t>(size) : 0;
    }
    return true;
}

ControlClient::Answer ControlClient::receive() {
    constexpr std::string_view kError = "error ";
    Answer answer;
    while (auto line = readLine()) {
        if (*line == "ok") {
            answer.ok = true;
            return answer;
        }
        if (line->starts_with(kError)) {
            answer.reason = line->substr(kError.size());
            return answer;
        }
        answer.lines.push_back(std::move(*line));
    }
    hangUp();
    answer.reason = "no answer";
    return answer;
}

std::optional<std::string> ControlClient::readLine() {
    std::size_t length = received_.find('\n');
    while (length == std::string::npos) {
        std::array<char, 4096> buffer{};
        const ssize_t size = ::recv(fd_, buffer.data(), buffer.size(), 0);
        if (size == 0 || (size < 0 && errno != EINTR)) {
            return std::nullopt;
        }
        const std::size_t searched = received_.size();
        received_.append(buffer.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
        length = received_.find('\n', searched);
    }
    std::string line = received_.substr(0, length);
    received_.erase(0, length + 1);
    return line;
}

void ControlClient::hangUp() {
    if (fd_ >= 0) {
        ::close(std::exchange(fd_, -1));
    }
}

} // namespace keystrand::sim
