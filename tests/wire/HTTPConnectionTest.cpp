#include "wire/HTTPConnection.h"

#include "tests/support/FailingCalls.h"

#include <gtest/gtest.h>

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <string>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace {

using namespace std::chrono_literals;
using wire::HTTPConnection;
using wire::HTTPMessage;
using State = wire::HTTPConnectionState;
using Bytes = std::vector<std::uint8_t>;

class HTTPConnectionTest : public testing::Test {
  protected:
    HTTPConnectionTest() { connect(30s); }

    void connect(std::chrono::milliseconds patience) {
        int ends[2] = {-1, -1};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        connection_.emplace(base::FileDescriptor(ends[0]), patience);
        peer_ = base::FileDescriptor(ends[1]);
    }

    void write(const Bytes& bytes) const {
        EXPECT_EQ(::send(peer_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL),
                  static_cast<ssize_t>(bytes.size()));
    }

    [[nodiscard]] State receive() { return connection_->receive(message_); }

    std::optional<HTTPConnection> connection_;
    base::FileDescriptor peer_;
    HTTPMessage message_;
};

TEST_F(HTTPConnectionTest, MessagesComeInTheirOrderHoweverTheyAreCut) {
    const Bytes wanted = wire::encodeHTTPBodyWanted(7);
    Bytes all = wanted;
    const Bytes working = wire::encodeHTTPWorking();
    all.insert(all.end(), working.begin(), working.end());
    all.insert(all.end(), wanted.begin(), wanted.end());
    std::thread writer([&] {
        for (const std::uint8_t byte : all) {
            write({byte});
            std::this_thread::yield();
        }
    });
    EXPECT_EQ(receive(), State::open);
    EXPECT_EQ(message_.type, wire::HTTPMessageType::bodyWanted);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 7U);
    EXPECT_EQ(receive(), State::open);
    EXPECT_EQ(message_.type, wire::HTTPMessageType::working);
    EXPECT_TRUE(message_.fields.empty());
    EXPECT_EQ(receive(), State::open);
    EXPECT_EQ(message_.type, wire::HTTPMessageType::bodyWanted);
    writer.join();
}

TEST_F(HTTPConnectionTest, PeerThatSaysNothingOrStopsInAMessageIsGivenUp) {
    const Bytes message = wire::encodeHTTPBodyWanted(7);
    for (const std::ptrdiff_t size : {0, 1, 11, 12, 15}) {
        connect(5ms);
        write({message.begin(), message.begin() + size});
        EXPECT_EQ(receive(), State::timedOut) << size;
        EXPECT_EQ(message_.type, HTTPMessage().type) << "the message is as before";
    }
}

TEST_F(HTTPConnectionTest, PeerThatHangsUp) {
    EXPECT_FALSE(connection_->isHungUp());
    const Bytes message = wire::encodeHTTPBodyWanted(7);
    write(message);
    write({message.begin(), message.end() - 1});
    peer_.reset();
    EXPECT_TRUE(connection_->isHungUp());
    EXPECT_EQ(receive(), State::open) << "what came before is there";
    EXPECT_EQ(receive(), State::hungUp) << "half a message is none";
    EXPECT_EQ(connection_->send(message), State::hungUp);
}

TEST_F(HTTPConnectionTest, NothingIsReceivedAfterTheEnd) {
    write(wire::encodeHTTPBodyWanted(7));
    connection_->endAt(HTTPConnection::Clock::now() + 1h);
    EXPECT_EQ(receive(), State::open);
    write(wire::encodeHTTPBodyWanted(8));
    connection_->endAt(HTTPConnection::Clock::now() - 1ms);
    EXPECT_EQ(receive(), State::timedOut);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 7U) << "the message is as before";
}

TEST_F(HTTPConnectionTest, ReceiveThatIsInterruptedIsDoneAgainAndOneThatFailsIsAHangUp) {
    write(wire::encodeHTTPBodyWanted(7));
    support::FailingCalls::recv = {EINTR, EINTR};
    EXPECT_EQ(receive(), State::open);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 7U);
    write(wire::encodeHTTPBodyWanted(8));
    support::FailingCalls::recv = {ECONNRESET};
    EXPECT_EQ(receive(), State::hungUp);
    connect(30s);
    peer_.reset();
    support::FailingCalls::recv = {EINTR};
    EXPECT_EQ(receive(), State::hungUp) << "the end is one after an interruption, too";
}

TEST_F(HTTPConnectionTest, SendThatIsInterruptedIsDoneAgainAndOneThatFailsIsAHangUp) {
    const Bytes message = wire::encodeHTTPBodyWanted(7);
    support::FailingCalls::send = {EINTR, EAGAIN, EINTR};
    EXPECT_EQ(connection_->send(message), State::open);
    Bytes received(message.size());
    EXPECT_EQ(::recv(peer_.get(), received.data(), received.size(), MSG_DONTWAIT),
              static_cast<ssize_t>(received.size()));
    EXPECT_EQ(received, message);
    support::FailingCalls::send = {ECONNRESET};
    EXPECT_EQ(connection_->send(message), State::hungUp);
    EXPECT_EQ(::recv(peer_.get(), received.data(), received.size(), MSG_DONTWAIT), -1);
}

TEST_F(HTTPConnectionTest, WaitThatIsInterruptedIsDoneAgainAndOneThatFailsIsAHangUp) {
    support::FailingCalls::recv = {EAGAIN};
    support::FailingCalls::poll = {EINTR, EINTR};
    write(wire::encodeHTTPBodyWanted(7));
    EXPECT_EQ(receive(), State::open);
    EXPECT_TRUE(support::FailingCalls::poll.empty());
    support::FailingCalls::poll = {ENOMEM};
    EXPECT_EQ(receive(), State::hungUp);
    support::FailingCalls::send = {EAGAIN};
    support::FailingCalls::poll = {ENOMEM};
    EXPECT_EQ(connection_->send(wire::encodeHTTPWorking()), State::hungUp);
}

TEST_F(HTTPConnectionTest, WaitThatIsInterruptedEndsAtItsTime) {
    connect(5ms);
    support::FailingCalls::poll = {EINTR};
    EXPECT_EQ(receive(), State::timedOut);
}

TEST_F(HTTPConnectionTest, WaitEndsWithTheInterruptAndNotBeforeWhatHasCome) {
    int ends[2] = {-1, -1};
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const base::FileDescriptor interrupt(ends[0]);
    base::FileDescriptor other(ends[1]);
    HTTPConnection interrupted(base::FileDescriptor(::dup(peer_.get())), 30s, interrupt.get());
    other.reset();
    EXPECT_EQ(interrupted.receive(message_), State::interrupted);
    EXPECT_EQ(connection_->send(wire::encodeHTTPBodyWanted(7)), State::open);
    support::FailingCalls::recv = {EAGAIN};
    EXPECT_EQ(interrupted.receive(message_), State::open);
    EXPECT_EQ(wire::decodeHTTPBodyWanted(message_.fields), 7U);
}

TEST_F(HTTPConnectionTest, EarlierOfTheTwoEndsCounts) {
    connection_->endAt(HTTPConnection::Clock::now() + 5ms);
    EXPECT_EQ(receive(), State::timedOut);
    connect(5ms);
    connection_->endAt(HTTPConnection::Clock::now() + 1h);
    EXPECT_EQ(receive(), State::timedOut);
}

TEST_F(HTTPConnectionTest, WhatIsNoMessage) {
    write(Bytes(12, 'x'));
    EXPECT_EQ(receive(), State::malformed);
}

TEST_F(HTTPConnectionTest, LargePiecesArriveWholeFromASlowReader) {
    Bytes body(1'000'000);
    for (std::size_t i = 0; i < body.size(); ++i) {
        body[i] = static_cast<std::uint8_t>(i * 7 / 5);
    }
    HTTPConnection other(std::move(peer_), std::nullopt);
    std::thread writer([&] {
        for (std::span<const std::uint8_t> left(body); !left.empty();) {
            const auto piece = left.first(std::min(left.size(), wire::kHTTPMaxPieceSize));
            EXPECT_EQ(other.sendPiece(piece), State::open);
            left = left.subspan(piece.size());
        }
    });
    Bytes received;
    while (received.size() < body.size() && receive() == State::open) {
        EXPECT_EQ(message_.type, wire::HTTPMessageType::piece);
        received.insert(received.end(), message_.fields.begin(), message_.fields.end());
        std::this_thread::yield();
    }
    writer.join();
    EXPECT_TRUE(received == body);
}

TEST_F(HTTPConnectionTest, ReaderThatDoesNotReadIsGivenUp) {
    connect(5ms);
    const Bytes piece(wire::kHTTPMaxPieceSize);
    State state = State::open;
    for (int i = 0; i < 1000 && state == State::open; ++i) {
        state = connection_->sendPiece(piece);
    }
    EXPECT_EQ(state, State::timedOut);
}

} // namespace
