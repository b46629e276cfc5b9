#include "tests/system/RelaunchFixture.h"

#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace system_tests {

namespace {

constexpr int kFirstHandedDescriptor = 3;

} // namespace

RelaunchFixture::RelaunchFixture()
    : AnalyticsFixture(support::directoryInMemory()),
      eventSocket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
    std::filesystem::create_directories(real("/var/lib/kstd/alarms"));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    real("/run/kstd/events.sock").copy(address.sun_path, sizeof address.sun_path - 1);
    const int on = 1;
    EXPECT_EQ(::setsockopt(eventSocket_, SOL_SOCKET, SO_PASSCRED, &on, sizeof on), 0);
    EXPECT_EQ(::bind(eventSocket_, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
}

RelaunchFixture::~RelaunchFixture() {
    ::close(eventSocket_);
}

std::unique_ptr<Program> RelaunchFixture::relaunched() const {
    return std::make_unique<Program>(words(), Program::Input::ofTest, [this] { handOver(); });
}

std::unique_ptr<support::SystemCallGate>
RelaunchFixture::relaunchedBehind(support::SystemCallGate::Judge judge) const {
    return std::make_unique<support::SystemCallGate>(words(), std::move(judge),
                                                     [this] { handOver(); });
}

void RelaunchFixture::dropEvents() const {
    char byte = 0;
    while (::recv(eventSocket_, &byte, sizeof byte, MSG_DONTWAIT) >= 0) {
    }
}

/// In the new process.
void RelaunchFixture::handOver() const {
    const int copy = ::fcntl(eventSocket_, F_DUPFD, kFirstHandedDescriptor + 1);
    ::dup2(copy, kFirstHandedDescriptor);
    ::close(copy);
    ::setenv("LISTEN_FDS", "1", 1);
    ::setenv("LISTEN_FDNAMES", "events", 1);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
}

std::vector<std::string> RelaunchFixture::words() const {
    std::vector<std::string> all = {KSTD_DEV, "--root", root.path().string()};
    all.insert(all.end(), options.begin(), options.end());
    return all;
}

} // namespace system_tests
