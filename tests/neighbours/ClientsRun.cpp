// A kernel side with hostile clients.

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "keystrand-sim/ControlClient.h"
#include "tests/neighbours/Batches.h"
#include "tests/neighbours/KernelSide.h"
#include "tests/support/TemporaryDirectory.h"
#include "wire/CommandTable.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

using Operation = wire::KernelOperation;

constexpr std::size_t kHandleSize = 16;
constexpr std::size_t kReplyHeaderSize = wire::kKernelReplyHeaderSize;

/// Payloads of commands to begin with.
std::vector<Bytes> payloads() {
    std::vector<Bytes> found;
    std::vector<std::filesystem::path> paths;
    for (const char* const kind :
         {"credential_command", "verify_policy", "verify_acl", "process_acl"}) {
        for (const auto& entry :
             std::filesystem::directory_iterator(base::concat(KSTD_CORPORA, '/', kind))) {
            paths.push_back(entry.path());
        }
    }
    // In the same order everywhere.
    std::sort(paths.begin(), paths.end());
    for (const auto& path : paths) {
        std::ifstream stream(path, std::ios::binary);
        found.emplace_back(std::istreambuf_iterator<char>(stream),
                           std::istreambuf_iterator<char>());
    }
    require(!found.empty(), "no payloads to begin with");
    return found;
}

/// A client as somebody writes it who has read the page on the kernel socket and means no good.
class HostileClient {
  public:
    HostileClient(const std::string& path, Random& random, const std::vector<Bytes>& payloads)
        : address_(base::UnixAddress::of(path).value()), random_(random), payloads_(payloads) {}

    /// One request, and what becomes of it.
    void exchange() {
        if (!socket_.isOpen()) {
            connect();
        }
        Bytes packet = request();
        if (random_.oneIn(5)) {
            mutate(random_, packet);
        }
        if (random_.oneIn(2000)) {
            packet.resize(wire::kKernelMessageMaxSize + random_.below(3) - 1);
        }
        if (!send(packet)) {
            socket_.reset();
            return;
        }
        if (random_.oneIn(60)) {
            // Gone before the answer is there.
            socket_.reset();
            return;
        }
        receive(packet);
    }

    /// What everybody may rely on. Its connection is a new one.
    void behave() {
        connect();
        Bytes path;
        append(path, std::string_view(wire::rm::kKernelServicePath));
        Bytes opening;
        append(opening, std::uint32_t{0});
        append(opening, std::span<const std::uint8_t>(path));
        require(ask(Operation::open, opening).status == 0, "a client that behaves cannot open");
        const Bytes value = random_.bytes(20);
        Bytes variable;
        append(variable, std::uint32_t{7});
        // Whoever has filled the table makes room.
        for (std::uint32_t id = 0; id < 40; ++id) {
            Bytes none;
            append(none, id);
            static_cast<void>(
                ask(Operation::structCall, call(kKSTCommandSetEnvironmentVariable, none)));
        }
        Bytes set = variable;
        append(set, std::span<const std::uint8_t>(value));
        static_cast<void>(ask(Operation::structCall, call(kKSTCommandSetEnvironmentVariable, set)));
        require(
            ask(Operation::structCall, call(kKSTCommandGetEnvironmentVariable, variable)).body ==
                value,
            "a variable is not what was set");
    }

  private:
    struct Reply {
        std::int32_t status = 0;
        Bytes body = {};
    };

    void connect() {
        socket_ = base::FileDescriptor(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
        const timeval patience{30, 0};
        ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
        require(::connect(socket_.get(), address_.get(), address_.size()) == 0,
                "cannot connect to the kernel side");
    }

    [[nodiscard]] bool send(const Bytes& packet) const {
        return ::send(socket_.get(), packet.data(), packet.size(), MSG_NOSIGNAL) ==
               static_cast<ssize_t>(packet.size());
    }

    Reply ask(Operation operation, const Bytes& body) {
        const auto header = wire::encodeKernelRequestHeader({operation, ++sequence_});
        Bytes packet(header.begin(), header.end());
        append(packet, std::span<const std::uint8_t>(body));
        require(send(packet), "a request that keeps the rules is not taken");
        auto reply = receive(packet);
        require(reply.has_value(), "a request that keeps the rules is not answered");
        return *std::move(reply);
    }

    /// None when the connection has ended, as it must when there was no header.
    std::optional<Reply> receive(const Bytes& packet) {
        static thread_local Bytes buffer(wire::kKernelMessageMaxSize + 1);
        const ssize_t length = ::recv(socket_.get(), buffer.data(), buffer.size(), 0);
        require(length >= 0 || errno != EAGAIN, "the kernel side is silent");
        const auto asked = packet.size() <= wire::kKernelMessageMaxSize
                               ? wire::decodeKernelRequestHeader(packet)
                               : std::nullopt;
        if (length <= 0) {
            require(!asked, "hung up on a request with a header");
            socket_.reset();
            return std::nullopt;
        }
        const std::span<const std::uint8_t> bytes(buffer.data(), static_cast<std::size_t>(length));
        const auto header = wire::decodeKernelReplyHeader(bytes);
        require(asked && header && header->operation == asked->operation &&
                    header->sequence == asked->sequence,
                "a reply to no request");
        const auto body = bytes.subspan(kReplyHeaderSize);
        require(header->status == 0 || (header->reported == 0 && body.empty()),
                "a failure with a body");
        if (header->operation == Operation::structCall && header->status == 0) {
            require(header->reported == body.size(), "an output of another size");
            remember(packet, body);
        }
        return Reply{header->status, Bytes(body.begin(), body.end())};
    }

    /// Handles are the best that there is to begin with.
    void remember(const Bytes& packet, std::span<const std::uint8_t> body) {
        const auto request =
            wire::decodeKernelStruct(std::span(packet).subspan(wire::kKernelRequestHeaderSize));
        if (request && request->input.size() >= kKSTCommandHeaderSize &&
            request->input[4] == kKSTCommandContextCreate && body.size() >= kHandleSize) {
            handles_[random_.below(handles_.size())] =
                Bytes(body.begin(), body.begin() + kHandleSize);
        }
    }

    [[nodiscard]] static Bytes call(std::uint8_t command, const Bytes& payload) {
        const auto prefix = wire::encodeKernelStructPrefix(0, 4096);
        Bytes body(prefix.begin(), prefix.end());
        append(body, std::string_view("DRCS"));
        append(body, std::uint32_t{command});
        append(body, std::span<const std::uint8_t>(payload));
        return body;
    }

    Bytes request() {
        const auto operation = static_cast<Operation>(random_.oneIn(3) ? 1 + random_.below(7) : 5);
        const auto header = wire::encodeKernelRequestHeader({operation, ++sequence_});
        Bytes packet(header.begin(), header.end());
        append(packet, std::span<const std::uint8_t>(body(operation)));
        return packet;
    }

    Bytes body(Operation operation) {
        Bytes made;
        const std::string path =
            random_.oneIn(4) ? random_.text(random_.length(1100)) : wire::rm::kKernelServicePath;
        switch (operation) {
        case Operation::findByPath:
            append(made, std::string_view(path));
            return made;
        case Operation::findByClassName:
            append(made, std::string_view(random_.oneIn(2) ? "Keystrand" : path));
            return made;
        case Operation::copyProperty:
            append(made, static_cast<std::uint16_t>(path.size()));
            append(made, std::string_view(path));
            append(made, std::string_view(random_.oneIn(3) ? random_.text(random_.length(260))
                                                           : wire::rm::kTimerRestartedProperty));
            return made;
        case Operation::open:
            append(made, static_cast<std::uint32_t>(random_.oneIn(8) ? random_.number() : 0));
            append(made, std::string_view(path));
            return made;
        case Operation::structCall:
            return call(command(), payload());
        case Operation::scalarCall: {
            const std::size_t inputs = random_.oneIn(2) ? 0 : random_.length(17);
            append(made, static_cast<std::uint32_t>(random_.oneIn(3) ? random_.number() : 2));
            append(made, static_cast<std::uint32_t>(random_.length(17)));
            append(made, static_cast<std::uint32_t>(inputs));
            for (std::size_t i = 0; i < inputs; ++i) {
                append(made, random_.number());
            }
            return made;
        }
        }
        return random_.bytes(random_.length(300));
    }

    std::uint8_t command() {
        return random_.oneIn(10)
                   ? static_cast<std::uint8_t>(random_.next())
                   : wire::kCommandKinds[random_.below(std::size(wire::kCommandKinds))].code;
    }

    Bytes payload() {
        Bytes made;
        const Bytes& handle = handles_[random_.below(handles_.size())];
        switch (random_.below(8)) {
        case 0:
            return made;
        case 1:
            return handle;
        case 2:
            append(made, std::span<const std::uint8_t>(handle));
            append(made, static_cast<std::uint32_t>(random_.below(16)));
            append(made, static_cast<std::uint32_t>(random_.below(4)));
            return made;
        case 3:
            append(made, static_cast<std::uint32_t>(random_.below(40)));
            append(made, std::span<const std::uint8_t>(random_.bytes(random_.length(70))));
            return made;
        case 4:
            // Control codes, with inputs of their sizes and others.
            append(made, static_cast<std::uint32_t>(random_.below(10)));
            append(made,
                   std::span<const std::uint8_t>(Bytes(
                       random_.of(kControlSizes), static_cast<std::uint8_t>(random_.below(2)))));
            return made;
        default:
            made = payloads_[random_.below(payloads_.size())];
            if (made.size() >= handle.size() && !handle.empty() && !random_.oneIn(4)) {
                std::copy(handle.begin(), handle.end(), made.begin());
            }
            if (random_.oneIn(3)) {
                mutate(random_, made);
            }
            return made;
        }
    }

    static constexpr std::size_t kControlSizes[] = {0, 1, 16, 32, 64, 65, 256, 257};

    base::UnixAddress address_;
    Random& random_;
    const std::vector<Bytes>& payloads_;
    base::FileDescriptor socket_;
    std::uint64_t sequence_ = 0;
    std::array<Bytes, 8> handles_ = {Bytes(kHandleSize)};
};

/// Once the kernel side has seen that the clients are gone, and does not keep their requests.
Footprint footprintAfter(const Daemon& kernel, keystrand::sim::ControlClient& control,
                         std::size_t descriptors) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    Footprint found;
    do {
        require(control.command("requests clear").ok, "no answer on the control socket");
        found = Footprint::of(kernel.process());
    } while (descriptors != 0 && found.descriptors != descriptors &&
             std::chrono::steady_clock::now() < deadline);
    return found;
}

} // namespace

void runClients(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 1'000;
    Batches batches(options, "clients");
    const support::TemporaryDirectory root;
    const std::vector<Bytes> some = payloads();
    Daemon kernel({KEYSTRAND_SIM, "--root", root.path().string(), "--quiet"}, -1, "ready");
    while (!kernel.isReady()) {
        kernel.listen();
        require(kernel.runs(), "the kernel side ended with " + kernel.ending());
    }
    auto control =
        keystrand::sim::ControlClient::connect(root.file("run/keystrand/control.sock"), 100);
    require(control.has_value(), "no control socket");
    const std::string path = root.file("run/keystrand/service.sock");
    std::uint64_t exchanges = 0;
    // Nobody is connected but for the control socket.
    const std::size_t descriptors = footprintAfter(kernel, *control, 0).descriptors;
    Growth growth(mostGrowth(4'000));
    batches.guard([&] {
        do {
            Random random = batches.ideas();
            {
                std::array<HostileClient, 3> clients = {HostileClient(path, random, some),
                                                        HostileClient(path, random, some),
                                                        HostileClient(path, random, some)};
                for (std::uint64_t i = 0; i < kBatch; ++i) {
                    clients[random.below(clients.size())].exchange();
                }
                clients.front().behave();
            }
            kernel.listen();
            require(kernel.runs(), "the kernel side ended with " + kernel.ending());
            growth.look(footprintAfter(kernel, *control, descriptors));
            exchanges += kBatch;
        } while (batches.end(exchanges));
    });
    batches.print(base::concat(kernel.lines(), " lines, ", growth.text()));
}

} // namespace neighbours
