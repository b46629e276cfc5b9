#include "tests/keystrand-sim/SimulatorProcess.h"

#include <chrono>
#include <cstring>
#include <filesystem>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

constexpr int kPatienceMilliseconds =
    static_cast<int>(std::chrono::milliseconds(support::kPatience).count());

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    return address;
}

bool isReadable(int fd, int milliseconds) {
    pollfd watched{fd, POLLIN, 0};
    return ::poll(&watched, 1, milliseconds) == 1;
}

} // namespace

PacketSocket::PacketSocket(PacketSocket&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}

PacketSocket& PacketSocket::operator=(PacketSocket&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
}

PacketSocket::~PacketSocket() {
    if (fd_ >= 0) {
        ::close(fd_);
    }
}

PacketSocket PacketSocket::connectedTo(const std::string& path) {
    PacketSocket client(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    const sockaddr_un address = addressOf(path);
    EXPECT_EQ(::connect(client.fd_, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0)
        << path;
    return client;
}

PacketSocket PacketSocket::boundTo(const std::string& path) {
    PacketSocket owner(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const sockaddr_un address = addressOf(path);
    EXPECT_EQ(::bind(owner.fd_, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0)
        << path;
    return owner;
}

bool PacketSocket::send(const ByteVector& packet) const {
    return ::send(fd_, packet.data(), packet.size(), MSG_NOSIGNAL) ==
           static_cast<ssize_t>(packet.size());
}

std::optional<ByteVector> PacketSocket::receive() const {
    ByteVector packet(200'000);
    if (!isReadable(fd_, kPatienceMilliseconds)) {
        return std::nullopt;
    }
    const ssize_t size = ::recv(fd_, packet.data(), packet.size(), 0);
    if (size <= 0) {
        return std::nullopt;
    }
    packet.resize(static_cast<std::size_t>(size));
    return packet;
}

bool PacketSocket::hasSomething() const {
    return isReadable(fd_, 0);
}

bool PacketSocket::awaitHangUp() const {
    char byte = 0;
    return isReadable(fd_, kPatienceMilliseconds) && ::recv(fd_, &byte, 1, 0) <= 0;
}

void SimulatorProcess::SetUp() {
    std::filesystem::create_directories(path("run/kstd"));
}

std::vector<std::string>
SimulatorProcess::commandLine(const std::vector<std::string>& options) const {
    std::vector<std::string> words = {KEYSTRAND_SIM_PROGRAM, "--root", root_.path().string()};
    words.insert(words.end(), options.begin(), options.end());
    return words;
}

void SimulatorProcess::start(const std::vector<std::string>& options) {
    program_ = std::make_unique<support::Program>(commandLine(options));
    ASSERT_EQ(program_->awaitLine(""), "keystrand-sim: ready");
    control_ = ControlClient::connect(controlPath());
    ASSERT_TRUE(control_);
}

std::string SimulatorProcess::path(const std::string& below) const {
    return root_.file(below);
}

ControlClient::Answer SimulatorProcess::tell(const std::string& line) {
    auto answer = control_->command(line);
    EXPECT_TRUE(answer.ok) << line << ": " << answer.reason;
    return answer;
}

std::string SimulatorProcess::ask(const std::string& line, const std::string& key) {
    return tell(line).value(key).value_or("");
}

PacketSocket SimulatorProcess::openClient() const {
    PacketSocket client = connect();
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, 0, 0));
    return client;
}

ByteVector SimulatorProcess::exchange(const PacketSocket& client, const ByteVector& packet) {
    EXPECT_TRUE(client.send(packet));
    return client.receive().value_or(ByteVector());
}

ByteVector SimulatorProcess::call(const PacketSocket& client, const ByteVector& input) {
    return exchange(client, structCall(2, 256, input));
}

} // namespace keystrand::sim::test
