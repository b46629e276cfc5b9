#pragma once

#include "keystrand-sim/ControlClient.h"
#include "tests/keystrand/Bytes.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace keystrand::sim::test {

using namespace keystrand::test;

/// A packet socket of the test's own, for one end or the other. Waits are bounded.
class PacketSocket {
  public:
    explicit PacketSocket(int fd) : fd_(fd) {}
    PacketSocket(PacketSocket&& other) noexcept;
    PacketSocket& operator=(PacketSocket&& other) noexcept;
    ~PacketSocket();

    /// A client of a listening SOCK_SEQPACKET socket.
    [[nodiscard]] static PacketSocket connectedTo(const std::string& path);
    /// The owner of a datagram socket; the file stays when the socket goes.
    [[nodiscard]] static PacketSocket boundTo(const std::string& path);

    [[nodiscard]] int fd() const { return fd_; }
    [[nodiscard]] bool isOpen() const { return fd_ >= 0; }
    [[nodiscard]] bool send(const ByteVector& packet) const;
    /// The next packet; none when the other end has hung up or patience ended.
    [[nodiscard]] std::optional<ByteVector> receive() const;
    /// Whether a packet, or the end, is there already.
    [[nodiscard]] bool hasSomething() const;
    /// Whether the other end hangs up, which must come before any packet.
    [[nodiscard]] bool awaitHangUp() const;

  private:
    int fd_;
};

/// A running simulator in a private root.
class SimulatorProcess : public testing::Test {
  protected:
    void SetUp() override;

    /// Starts it and waits until it is ready.
    void start(const std::vector<std::string>& options = {"--clock", "1000000"});
    [[nodiscard]] std::vector<std::string>
    commandLine(const std::vector<std::string>& options) const;

    [[nodiscard]] std::string path(const std::string& below) const;
    [[nodiscard]] std::string servicePath() const { return path("run/keystrand/service.sock"); }
    [[nodiscard]] std::string controlPath() const { return path("run/keystrand/control.sock"); }
    [[nodiscard]] std::string eventPath() const { return path("run/kstd/events.sock"); }

    ControlClient::Answer tell(const std::string& line);
    /// The value of a key in the answer, empty when there is none.
    std::string ask(const std::string& line, const std::string& key);

    [[nodiscard]] PacketSocket connect() const { return PacketSocket::connectedTo(servicePath()); }
    /// A client on which calls are possible.
    [[nodiscard]] PacketSocket openClient() const;

    /// Sends a request and hands back the packet that answers it; empty without one.
    static ByteVector exchange(const PacketSocket& client, const ByteVector& packet);
    /// A struct call with that input, all the room there is for output.
    static ByteVector call(const PacketSocket& client, const ByteVector& input);

    support::TemporaryDirectory root_;
    std::unique_ptr<support::Program> program_;
    std::optional<ControlClient> control_;
};

inline constexpr std::string_view kEntryPath = "IOService:/IOResources/Keystrand";

inline ByteVector openRequest(std::uint64_t sequence, std::uint32_t type = 0,
                              std::string_view entry = kEntryPath) {
    return request(4, sequence, Bytes().u32(type).text(entry));
}

inline ByteVector propertyRequest(std::uint64_t sequence, std::string_view name,
                                  std::string_view entry = kEntryPath) {
    return request(3, sequence, Bytes().u16(entry.size()).text(entry).text(name));
}

/// An event as it stands in a datagram.
inline ByteVector eventDatagram(std::string_view stream, std::string_view name) {
    return Bytes()
        .text("KSTE")
        .u8(1)
        .u8(stream.size())
        .u16(name.size())
        .u32(0)
        .text(stream)
        .text(name);
}

} // namespace keystrand::sim::test
