#include "tests/system/SystemFixture.h"

#include "base/Concat.h"
#include "wire/EventDatagram.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace system_tests {

namespace {

constexpr int kConnectAttempts = 100;

std::vector<std::string> joined(std::vector<std::string> words,
                                const std::vector<std::string>& more) {
    words.insert(words.end(), more.begin(), more.end());
    return words;
}

/// "request 1 command 26 control 7 payload 07000000.... status 0"
std::optional<Request> parseControl(const std::string& line) {
    std::istringstream words(line);
    std::string word;
    std::uint64_t index = 0;
    std::uint32_t command = 0;
    Request request;
    words >> word >> index >> word >> command >> word >> request.control >> word >>
        request.payload >> word >> request.status;
    if (!words || command != 26 || request.payload.size() < 8) {
        return std::nullopt;
    }
    request.payload.erase(0, 8);
    return request;
}

} // namespace

SystemFixture::SystemFixture(const std::filesystem::path& parent)
    : root(parent), sender_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    for (const char* const directory : {"run/kstd", "etc/kstd", "var/root"}) {
        std::filesystem::create_directories(root.path() / directory);
    }
}

void SystemFixture::startKernel(const std::vector<std::string>& options) {
    kernelProgram =
        std::make_unique<Program>(joined({KEYSTRAND_SIM, "--root", root.path().string()}, options));
    ASSERT_TRUE(kernelProgram->awaitLine("keystrand-sim: ready"));
    control_ = keystrand::sim::ControlClient::connect(real("/run/keystrand/control.sock"),
                                                      kConnectAttempts);
    ASSERT_TRUE(control_);
}

void SystemFixture::stopKernel() {
    control_.reset();
    kernelProgram->signal(SIGTERM);
    EXPECT_EQ(kernelProgram->awaitEnd(), 0);
    kernelProgram.reset();
}

std::vector<std::string> SystemFixture::kernel(const std::string& command) {
    const auto answer = control_->command(command);
    EXPECT_TRUE(answer.ok) << command << ": " << answer.reason;
    return answer.lines;
}

std::string SystemFixture::kernelStatus(const std::string& key) {
    return control_->command("status").value(key).value_or("");
}

std::vector<Request> SystemFixture::requests() {
    std::vector<Request> all;
    for (const std::string& line : kernel("requests")) {
        if (const auto request = parseControl(line)) {
            all.push_back(*request);
        }
    }
    return all;
}

std::unique_ptr<Program> SystemFixture::beginDaemon(const std::vector<std::string>& options) {
    return std::make_unique<Program>(joined({KSTD_DEV, "--root", root.path().string()}, options));
}

std::unique_ptr<Program> SystemFixture::startDaemon(const std::vector<std::string>& options) {
    auto daemon = beginDaemon(options);
    EXPECT_TRUE(daemon->awaitLine("kstd: main: Entering the main runloop."));
    return daemon;
}

std::unique_ptr<Program> SystemFixture::startSupervisor(int idleMilliseconds, bool startAtOnce) {
    std::vector<std::string> words{KSTD_SUPERVISE, "--root", root.path().string()};
    if (startAtOnce) {
        words.emplace_back("--start");
    }
    auto supervisor =
        std::make_unique<Program>(joined(words, {"--", KSTD_DEV, "--root", root.path().string(),
                                                 "--idle-exit", std::to_string(idleMilliseconds)}));
    EXPECT_TRUE(supervisor->awaitLine("kstd-supervise: ready"));
    return supervisor;
}

void SystemFixture::sendEvent(std::string_view name, std::string_view stream) {
    const auto datagram = wire::encodeEvent(stream, name).value();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    real("/run/kstd/events.sock").copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::sendto(sender_, datagram.data(), datagram.size(), 0,
                       reinterpret_cast<const sockaddr*>(&address), sizeof address),
              static_cast<ssize_t>(datagram.size()));
}

void SystemFixture::putSettings(const std::string& text) {
    const std::string fresh = real("/etc/kstd/new");
    std::ofstream(fresh) << text;
    std::filesystem::permissions(fresh, std::filesystem::perms::owner_read);
    std::filesystem::rename(fresh, real("/etc/kstd/managed-settings.conf"));
}

void SystemFixture::putFile(const std::string& path, const std::vector<std::uint8_t>& bytes) {
    std::ofstream(real(path), std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
}

std::optional<std::vector<std::uint8_t>> SystemFixture::file(const std::string& path) const {
    std::ifstream stream(real(path), std::ios::binary);
    if (!stream) {
        return std::nullopt;
    }
    return std::vector<std::uint8_t>(std::istreambuf_iterator<char>(stream), {});
}

std::string hex(const std::vector<std::uint8_t>& bytes) {
    return hex(std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size()));
}

std::string hex(std::string_view text) {
    std::string digits;
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        digits += "0123456789abcdef"[byte >> 4U];
        digits += "0123456789abcdef"[byte & 0xfU];
    }
    return digits;
}

std::string ackPayload(std::string_view property) {
    std::string padded(property);
    padded.resize(64, '\0');
    return hex(padded);
}

} // namespace system_tests
