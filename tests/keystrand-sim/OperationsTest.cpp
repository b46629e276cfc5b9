#include "tests/keystrand-sim/SimulatorProcess.h"

#include <sys/ioctl.h>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

class OperationsTest : public SimulatorProcess {
  protected:
    void SetUp() override {
        SimulatorProcess::SetUp();
        start();
    }
};

TEST_F(OperationsTest, FindByPath) {
    const PacketSocket client = connect();
    EXPECT_EQ(exchange(client, request(1, 77, Bytes().text(kEntryPath))),
              reply(1, 77, 0, 1, Bytes().text(kEntryPath)));
    EXPECT_EQ(exchange(client, request(1, 78, Bytes().text("IOService:/IOResources"))),
              reply(1, 78, 0, 0));
}

TEST_F(OperationsTest, FindByClassName) {
    const PacketSocket client = connect();
    EXPECT_EQ(exchange(client, request(2, ~std::uint64_t{0}, Bytes().text("Keystrand"))),
              reply(2, ~std::uint64_t{0}, 0, 1, Bytes().text(kEntryPath)));
    EXPECT_EQ(exchange(client, request(2, 0, Bytes().text("keystrand"))), reply(2, 0, 0, 0));
}

TEST_F(OperationsTest, TextLengthLimits) {
    const PacketSocket client = connect();
    const auto bodyOf = [](std::size_t size) {
        return Bytes().fill(size, 'x').get();
    };
    EXPECT_EQ(exchange(client, request(1, 1, bodyOf(0))), reply(1, 1, -6001, 0));
    EXPECT_EQ(exchange(client, request(1, 1, bodyOf(1))), reply(1, 1, 0, 0));
    EXPECT_EQ(exchange(client, request(1, 1, bodyOf(1023))), reply(1, 1, 0, 0));
    EXPECT_EQ(exchange(client, request(1, 1, bodyOf(1024))), reply(1, 1, 0, 0));
    EXPECT_EQ(exchange(client, request(1, 1, bodyOf(1025))), reply(1, 1, -6001, 0));
    EXPECT_EQ(exchange(client, request(2, 1, bodyOf(0))), reply(2, 1, -6001, 0));
    EXPECT_EQ(exchange(client, request(2, 1, bodyOf(255))), reply(2, 1, 0, 0));
    EXPECT_EQ(exchange(client, request(2, 1, bodyOf(256))), reply(2, 1, -6001, 0));
}

TEST_F(OperationsTest, CopyPropertyTellsAbsentFromEmpty) {
    const PacketSocket client = connect();
    EXPECT_EQ(exchange(client, propertyRequest(5, "P")), reply(3, 5, 0, 0));
    tell("property set P empty");
    EXPECT_EQ(exchange(client, propertyRequest(6, "P")), reply(3, 6, 0, 1));
    tell("property set P 0102ff");
    EXPECT_EQ(exchange(client, propertyRequest(7, "P")), reply(3, 7, 0, 1, {1, 2, 0xff}));
    tell("property remove P");
    EXPECT_EQ(exchange(client, propertyRequest(8, "P")), reply(3, 8, 0, 0));
}

TEST_F(OperationsTest, CopyPropertyOfAnotherEntry) {
    EXPECT_EQ(exchange(connect(), propertyRequest(5, "P", "elsewhere")), reply(3, 5, -6002, 0));
}

TEST_F(OperationsTest, MalformedCopyPropertyBodies) {
    const PacketSocket client = connect();
    const std::vector<ByteVector> bodies = {
        {},
        {1},
        Bytes().u16(0).text("P"),
        Bytes().u16(2).text("P"),
        Bytes().u16(1).text("P"),
        Bytes().u16(1025).fill(1025, 'x').text("P"),
        Bytes().u16(1).text("x").fill(256, 'P'),
    };
    for (const ByteVector& body : bodies) {
        EXPECT_EQ(exchange(client, request(3, 1, body)), reply(3, 1, -6001, 0));
    }
}

TEST_F(OperationsTest, Open) {
    const PacketSocket client = connect();
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, 0, 0));
    EXPECT_EQ(exchange(client, openRequest(2)), reply(4, 2, 0, 0));
    EXPECT_EQ(exchange(client, openRequest(3, 1)), reply(4, 3, -6004, 0));
    EXPECT_EQ(exchange(client, openRequest(4, 0, "elsewhere")), reply(4, 4, -6002, 0));
    EXPECT_EQ(exchange(client, request(4, 5, Bytes().u32(0))), reply(4, 5, -6001, 0));
    EXPECT_EQ(exchange(client, request(4, 6, {0, 0, 0})), reply(4, 6, -6001, 0));
}

TEST_F(OperationsTest, CallsNeedAnOpenConnection) {
    const PacketSocket client = connect();
    EXPECT_EQ(call(client, control(5, {1})), reply(5, 2, -6003, 0));
    EXPECT_EQ(exchange(client, request(6, 1, Bytes().u32(2).u32(1).u32(0))), reply(6, 1, -6003, 0));
    const PacketSocket other = openClient();
    EXPECT_EQ(call(client, control(5, {1})), reply(5, 2, -6003, 0));
    EXPECT_EQ(call(other, control(5, {1})), reply(5, 2, 0, 0));
}

TEST_F(OperationsTest, StructCallStatuses) {
    const PacketSocket client = openClient();
    EXPECT_EQ(exchange(client, request(5, 1, Bytes().u32(0).u16(0))), reply(5, 1, -6001, 0));
    EXPECT_EQ(exchange(client, request(5, 1, Bytes().u32(1).u32(0).bytes(control(5, {1})))),
              reply(5, 1, -6004, 0));
    EXPECT_EQ(call(client, {}), reply(5, 2, -6005, 0));
    EXPECT_EQ(call(client, Bytes().text("DRCS").u8(24).u16(0)), reply(5, 2, -6005, 0));
    EXPECT_EQ(call(client, Bytes().text("DRCX").u32(24).u32(1)), reply(5, 2, -6005, 0));
    EXPECT_EQ(call(client, frame(7, {})), reply(5, 2, -6006, 0));
    EXPECT_EQ(call(client, control(4, {})), reply(5, 2, -6006, 0));
    EXPECT_EQ(call(client, control(5, {})), reply(5, 2, -6007, 0));
}

TEST_F(OperationsTest, ReplyHasToFitIntoWhatIsOffered) {
    const PacketSocket client = openClient();
    const ByteVector value = Bytes().fill(64, 0xee);
    EXPECT_EQ(call(client, frame(24, Bytes().u32(9).bytes(value))), reply(5, 2, 0, 0));
    const ByteVector get = frame(25, Bytes().u32(9));
    EXPECT_EQ(exchange(client, structCall(3, 63, get)), reply(5, 3, -6008, 0));
    EXPECT_EQ(exchange(client, structCall(4, 64, get)), reply(5, 4, 0, 64, value));
    EXPECT_EQ(exchange(client, structCall(5, 65, get)), reply(5, 5, 0, 64, value));
}

TEST_F(OperationsTest, EnvironmentVariablesAreSharedWithTheControlSocket) {
    const PacketSocket client = openClient();
    tell("env set 4294967295 c0ffee");
    const ByteVector get = frame(25, Bytes().u32(0xffffffff));
    EXPECT_EQ(call(client, get), reply(5, 2, 0, 3, {0xc0, 0xff, 0xee}));
    EXPECT_EQ(call(client, frame(24, Bytes().u32(0xffffffff))), reply(5, 2, 0, 0));
    EXPECT_EQ(ask("env get 4294967295", "value"), "empty");
    EXPECT_EQ(call(client, get), reply(5, 2, 0, 0));
}

TEST_F(OperationsTest, ScalarCallTellsTheLogLevel) {
    const PacketSocket client = openClient();
    const ByteVector askLevel = request(6, 9, Bytes().u32(2).u32(1).u32(0));
    EXPECT_EQ(exchange(client, askLevel), reply(6, 9, 0, 1, Bytes().u64(40)));
    tell("log-level 10");
    EXPECT_EQ(exchange(client, askLevel), reply(6, 9, 0, 1, Bytes().u64(10)));
}

TEST_F(OperationsTest, ScalarCallStatuses) {
    const PacketSocket client = openClient();
    const auto scalar = [&](const ByteVector& body) {
        return exchange(client, request(6, 1, body));
    };
    EXPECT_EQ(scalar(Bytes().u32(0).u32(1).u32(0)), reply(6, 1, -6004, 0));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(0).u32(0)), reply(6, 1, -6008, 0));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(16).u32(0)), reply(6, 1, 0, 1, Bytes().u64(40)));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(17).u32(0)), reply(6, 1, -6001, 0));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(1).u32(16).fill(128, 0)), reply(6, 1, -6007, 0));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(1).u32(17).fill(136, 0)), reply(6, 1, -6001, 0));
    EXPECT_EQ(scalar(Bytes().u32(2).u32(1).u32(0).u8(0)), reply(6, 1, -6001, 0));
}

TEST_F(OperationsTest, PacketWithoutAGoodHeaderEndsTheConnection) {
    const ByteVector good = request(2, 1, Bytes().text("Keystrand"));
    std::vector<ByteVector> packets;
    for (const std::size_t offset : {0U, 3U, 4U, 6U, 7U}) {
        packets.push_back(good);
        packets.back()[offset] ^= 0x40U;
    }
    packets.emplace_back(good.begin(), good.begin() + 15);
    packets.push_back(request(0, 1, {}));
    packets.push_back(request(7, 1, {}));
    for (const ByteVector& packet : packets) {
        const PacketSocket client = connect();
        EXPECT_TRUE(client.send(packet));
        EXPECT_TRUE(client.awaitHangUp());
    }
    EXPECT_EQ(exchange(connect(), good), reply(2, 1, 0, 1, Bytes().text(kEntryPath)));
}

TEST_F(OperationsTest, LargestPacketIsTakenAndALargerOneEndsTheConnection) {
    constexpr std::size_t kMaxPacket = 131072;
    const PacketSocket client = openClient();
    const auto sized = [](std::size_t size) {
        return structCall(2, 0, frame(26, ByteVector(size - 16 - 8 - 8)));
    };
    EXPECT_EQ(exchange(client, sized(kMaxPacket)), reply(5, 2, -6007, 0));
    ASSERT_TRUE(client.send(sized(kMaxPacket + 1)));
    EXPECT_TRUE(client.awaitHangUp());
}

TEST_F(OperationsTest, RequestsAreAnsweredInTurn) {
    const PacketSocket client = connect();
    for (std::uint64_t sequence = 1; sequence <= 5; ++sequence) {
        ASSERT_TRUE(client.send(propertyRequest(sequence, "P")));
    }
    for (std::uint64_t sequence = 1; sequence <= 5; ++sequence) {
        EXPECT_EQ(client.receive(), reply(3, sequence, 0, 0));
    }
}

TEST_F(OperationsTest, ClientThatReadsNoRepliesHoldsUpNobody) {
    tell("property set P " + std::string(4000, 'a'));
    const PacketSocket silent = connect();
    int flag = 1;
    ASSERT_EQ(::ioctl(silent.fd(), FIONBIO, &flag), 0);
    std::uint64_t sent = 0;
    // Until both directions are full: the simulator holds one reply and reads no further.
    for (int round = 0; round < 3; ++round) {
        while (silent.send(propertyRequest(sent + 1, "P"))) {
            ++sent;
        }
        EXPECT_EQ(exchange(connect(), propertyRequest(1, "Q")), reply(3, 1, 0, 0));
    }
    const ByteVector value(2000, 0xaa);
    for (std::uint64_t sequence = 1; sequence <= sent; ++sequence) {
        ASSERT_EQ(silent.receive(), reply(3, sequence, 0, 1, value)) << sequence;
    }
}

TEST_F(OperationsTest, ClientsBeyondTheLimitWaitForOneToGo) {
    std::vector<PacketSocket> clients;
    for (int i = 0; i < 64; ++i) {
        clients.push_back(connect());
        ASSERT_EQ(exchange(clients.back(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
    }
    EXPECT_EQ(ask("status", "connections"), "64");
    const PacketSocket waiting = connect();
    ASSERT_TRUE(waiting.send(propertyRequest(2, "P")));
    EXPECT_EQ(ask("status", "connections"), "64");
    EXPECT_FALSE(waiting.hasSomething());
    clients.pop_back();
    EXPECT_EQ(waiting.receive(), reply(3, 2, 0, 0));
}

} // namespace

} // namespace keystrand::sim::test
