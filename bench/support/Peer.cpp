#include "bench/support/Peer.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"
#include "base/UnixAddress.h"
#include "bench/support/SystemError.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <csignal>
#include <cstring>
#include <new>
#include <span>
#include <stdexcept>
#include <string_view>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace bench {

namespace {

constexpr std::size_t kBufferSize = 4096;
constexpr int kBacklog = 8;
constexpr std::size_t kOperationOffset = sizeof wire::kKernelRequestMagic + 1;
constexpr std::size_t kSequenceOffset = wire::kKernelRequestHeaderSize - sizeof(std::uint64_t);

base::FileDescriptor seqpacketSocket() {
    base::FileDescriptor socket(::socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0));
    if (!socket.isOpen()) {
        throw systemError("cannot make a socket");
    }
    return socket;
}

base::UnixAddress addressOf(const std::string& path) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        throw std::runtime_error("path too long for a socket, choose another --dir: " + path);
    }
    return *address;
}

void growNumber(std::uint8_t* bytes) {
    std::uint64_t number = 0;
    static_cast<void>(base::ByteReader(bytes, sizeof number).readU64(number));
    static_cast<void>(base::ByteWriter(bytes, sizeof number).writeU64(number + 1));
}

} // namespace

/// Seen by all processes of the peer and by the one that made it.
struct Peer::Shared {
    std::atomic<std::uint64_t> structCalls{0};
    std::size_t requestSize = 0;
    std::array<std::uint8_t, kBufferSize> request{};
};

namespace {

/// Serves one connection until the client hangs up.
class Connection {
  public:
    Connection(int socket, const PeerScript& script, Peer::Shared& shared)
        : socket_(socket), growingNumber_(script.growingNumber), shared_(shared) {
        for (const auto& [operation, reply] : script.replies) {
            replies_.at(static_cast<std::size_t>(operation)) = reply;
        }
    }

    void serve() {
        for (;;) {
            const ssize_t length =
                ::recv(socket_, shared_.request.data(), shared_.request.size(), 0);
            if (length < static_cast<ssize_t>(wire::kKernelRequestHeaderSize)) {
                return;
            }
            shared_.requestSize = static_cast<std::size_t>(length);
            const std::size_t operation = shared_.request[kOperationOffset];
            if (operation >= replies_.size() || !answer(replies_[operation])) {
                return;
            }
            if (operation == static_cast<std::size_t>(wire::KernelOperation::copyProperty) &&
                growingNumber_) {
                growNumber(replies_[operation].data() + *growingNumber_);
            }
        }
    }

  private:
    bool answer(Bytes& reply) {
        if (reply.empty()) {
            return false;
        }
        if (shared_.request[kOperationOffset] ==
            static_cast<std::uint8_t>(wire::KernelOperation::structCall)) {
            shared_.structCalls.fetch_add(1, std::memory_order_relaxed);
        }
        std::memcpy(reply.data() + kSequenceOffset, shared_.request.data() + kSequenceOffset,
                    sizeof(std::uint64_t));
        return ::send(socket_, reply.data(), reply.size(), MSG_NOSIGNAL) ==
               static_cast<ssize_t>(reply.size());
    }

    int socket_;
    std::optional<std::size_t> growingNumber_;
    std::array<Bytes, static_cast<std::size_t>(wire::KernelOperation::scalarCall) + 1> replies_;
    Peer::Shared& shared_;
};

/// A process for each connection: one that served several would have to ask which is ready.
[[noreturn]] void listenForEver(int listener, const PeerScript& script, Peer::Shared& shared) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    std::signal(SIGCHLD, SIG_IGN);
    for (;;) {
        const int socket = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
        if (socket < 0) {
            ::_exit(1);
        }
        if (::fork() == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            Connection(socket, script, shared).serve();
            ::_exit(0);
        }
        ::close(socket);
    }
}

} // namespace

Bytes preparedReply(wire::KernelOperation operation, std::uint32_t reported, const Bytes& body) {
    const auto header =
        wire::encodeKernelReplyHeader({.operation = operation, .reported = reported});
    Bytes reply(header.size() + body.size());
    std::copy(body.begin(), body.end(), std::copy(header.begin(), header.end(), reply.begin()));
    return reply;
}

PeerScript basicScript() {
    using wire::KernelOperation;
    const std::string_view path = wire::rm::kKernelServicePath;
    PeerScript script;
    for (const auto operation : {KernelOperation::findByPath, KernelOperation::findByClassName}) {
        script.replies[operation] = preparedReply(operation, 1, {path.begin(), path.end()});
    }
    script.replies[KernelOperation::open] = preparedReply(KernelOperation::open, 0, {});
    return script;
}

Peer::Peer(const std::string& socketPath, const PeerScript& script) {
    const base::FileDescriptor listener = seqpacketSocket();
    const base::UnixAddress address = addressOf(socketPath);
    if (::bind(listener.get(), address.get(), address.size()) != 0 ||
        ::listen(listener.get(), kBacklog) != 0) {
        throw systemError("cannot listen on " + socketPath);
    }
    void* const memory =
        ::mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    if (memory == MAP_FAILED) {
        throw systemError("cannot share memory with the peer");
    }
    shared_ = new (memory) Shared;
    listener_ = ::fork();
    if (listener_ == 0) {
        listenForEver(listener.get(), script, *shared_);
    }
    if (listener_ < 0) {
        ::munmap(shared_, sizeof(Shared));
        throw systemError("cannot start the peer");
    }
}

Peer::~Peer() {
    ::kill(listener_, SIGKILL);
    ::waitpid(listener_, nullptr, 0);
    ::munmap(shared_, sizeof(Shared));
}

std::uint64_t Peer::structCalls() const {
    return shared_->structCalls.load(std::memory_order_relaxed);
}

Bytes Peer::lastRequest() const {
    const std::span<const std::uint8_t> bytes(shared_->request);
    const auto request = bytes.first(shared_->requestSize);
    return {request.begin(), request.end()};
}

BareExchange::BareExchange(const std::string& socketPath, Bytes request)
    : socket_(seqpacketSocket()), request_(std::move(request)), reply_(kBufferSize) {
    const base::UnixAddress address = addressOf(socketPath);
    if (::connect(socket_.get(), address.get(), address.size()) != 0) {
        throw systemError("cannot connect to " + socketPath);
    }
}

void BareExchange::roundTrip() {
    if (::send(socket_.get(), request_.data(), request_.size(), MSG_NOSIGNAL) < 0) {
        throw systemError("cannot send to the peer");
    }
    const ssize_t length = ::recv(socket_.get(), reply_.data(), reply_.size(), 0);
    if (length <= 0) {
        throw std::runtime_error("the peer did not answer");
    }
    replySize_ = static_cast<std::size_t>(length);
    ++roundTrips_;
}

} // namespace bench
