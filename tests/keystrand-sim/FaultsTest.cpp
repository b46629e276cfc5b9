#include "tests/keystrand-sim/SimulatorProcess.h"

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

class FaultsTest : public SimulatorProcess {
  protected:
    void SetUp() override {
        SimulatorProcess::SetUp();
        start();
    }

    static ByteVector pattern(std::uint32_t size) {
        Bytes bytes;
        for (std::uint32_t i = 1; i <= size; ++i) {
            bytes.u8(i & 0xffU);
        }
        return bytes;
    }

    const ByteVector kAllow = control(5, {1});
    const ByteVector kForbid = control(5, {0});
    const ByteVector kDone = reply(5, 2, 0, 0);
};

TEST_F(FaultsTest, StatusForOneControlCodeTwice) {
    const PacketSocket client = openClient();
    tell("fault command=26 control=7 status=-42 times=2");
    EXPECT_EQ(call(client, kAllow), kDone);
    EXPECT_EQ(call(client, control(7, ackName("P"))), reply(5, 2, -42, 0));
    EXPECT_EQ(call(client, control(7, ackName("P"))), reply(5, 2, -42, 0));
    EXPECT_EQ(call(client, control(7, ackName("P"))), kDone);
    EXPECT_EQ(ask("status", "acks"), "1");
}

TEST_F(FaultsTest, StatusTakesThePlaceOfTheCommand) {
    const PacketSocket client = openClient();
    tell("fault command=26 status=2147483647");
    EXPECT_EQ(call(client, kForbid), reply(5, 2, 2147483647, 0));
    EXPECT_EQ(ask("status", "allowed"), "on");
}

TEST_F(FaultsTest, StatusAfterTheCommandWasCarriedOut) {
    const PacketSocket client = openClient();
    tell("fault command=26 status=-42 perform");
    EXPECT_EQ(call(client, kForbid), reply(5, 2, -42, 0));
    EXPECT_EQ(ask("status", "allowed"), "off");
}

TEST_F(FaultsTest, ReplyOfAGivenSize) {
    const PacketSocket client = openClient();
    tell("fault command=25 reply=0");
    tell("fault command=25 reply=70");
    tell("fault command=25 reply=131048");
    const ByteVector get = frame(25, Bytes().u32(1));
    EXPECT_EQ(exchange(client, structCall(3, 64, get)), reply(5, 3, 0, 0));
    EXPECT_EQ(exchange(client, structCall(4, 64, get)), reply(5, 4, 0, 70, pattern(70)));
    EXPECT_EQ(exchange(client, structCall(5, 64, get)), reply(5, 5, 0, 131048, pattern(131048)));
    EXPECT_FALSE(control_->command("fault command=25 reply=131049").ok);
}

TEST_F(FaultsTest, ReportedSizeThatIsNotTheBodys) {
    const PacketSocket client = openClient();
    tell("env set 1 0102");
    tell("fault command=25 reported=4");
    tell("fault command=25 reply=3 reported=1");
    EXPECT_EQ(call(client, frame(25, Bytes().u32(1))), reply(5, 2, 0, 4, {1, 2}));
    EXPECT_EQ(call(client, frame(25, Bytes().u32(1))), reply(5, 2, 0, 1, {1, 2, 3}));
}

TEST_F(FaultsTest, WrongSequence) {
    const PacketSocket client = openClient();
    tell("fault operation=struct wrong-sequence");
    EXPECT_EQ(call(client, kForbid), reply(5, 3, 0, 0));
    EXPECT_EQ(ask("status", "allowed"), "off");
    EXPECT_EQ(call(client, kAllow), kDone);
}

TEST_F(FaultsTest, WhatAClientSentBeforeItHungUpIsCarriedOut) {
    for (const char* fault : {"fault command=25 delay=600000", "fault command=25 silence"}) {
        tell(fault);
        tell("env set 1 01");
        const std::string already = ask("status", "requests");
        {
            const PacketSocket client = openClient();
            ASSERT_TRUE(client.send(structCall(2, 64, frame(25, Bytes().u32(1)))));
            ASSERT_TRUE(client.send(structCall(3, 64, frame(25, Bytes().u32(1)))));
            ASSERT_TRUE(client.send(structCall(4, 0, frame(24, Bytes().u32(1).u8(7)))));
        }
        tell("wait requests=" + std::to_string(std::stoi(already) + 3));
        EXPECT_EQ(ask("env get 1", "value"), "07") << fault;
    }
}

TEST_F(FaultsTest, SilenceSwallowsOneRequest) {
    const PacketSocket client = openClient();
    tell("fault command=26 silence");
    ASSERT_TRUE(client.send(structCall(10, 0, kForbid)));
    EXPECT_EQ(exchange(client, structCall(11, 0, kAllow)), reply(5, 11, 0, 0));
    EXPECT_EQ(tell("requests limit=1").lines.front(),
              "request 1 command 26 control 5 payload 0500000000 status none");
}

TEST_F(FaultsTest, HangUpInsteadOfAnAnswer) {
    const PacketSocket client = openClient();
    tell("fault command=26 hang-up");
    ASSERT_TRUE(client.send(structCall(10, 0, kForbid)));
    EXPECT_TRUE(client.awaitHangUp());
    EXPECT_EQ(ask("status", "allowed"), "on");
    EXPECT_EQ(call(openClient(), kForbid), kDone);
}

TEST_F(FaultsTest, HangUpAfterTheCommandWasCarriedOut) {
    const PacketSocket client = openClient();
    tell("fault command=26 hang-up perform");
    ASSERT_TRUE(client.send(structCall(10, 0, kForbid)));
    EXPECT_TRUE(client.awaitHangUp());
    EXPECT_EQ(ask("status", "allowed"), "off");
}

TEST_F(FaultsTest, LateAnswerHoldsUpOnlyItsOwnConnection) {
    const PacketSocket client = openClient();
    const PacketSocket other = openClient();
    tell("fault command=26 delay=1000");
    ASSERT_TRUE(client.send(structCall(10, 0, kForbid)));
    tell("wait requests=1");
    EXPECT_EQ(call(other, kAllow), kDone);
    EXPECT_FALSE(client.hasSomething());
    EXPECT_EQ(client.receive(), reply(5, 10, 0, 0));
    EXPECT_EQ(call(client, kAllow), kDone);
}

TEST_F(FaultsTest, ClientThatLeavesBeforeALateAnswer) {
    tell("fault command=26 delay=600000");
    {
        const PacketSocket client = openClient();
        ASSERT_TRUE(client.send(structCall(10, 0, kForbid)));
        tell("wait requests=1");
    }
    const PacketSocket other = openClient();
    EXPECT_EQ(call(other, kAllow), kDone);
    EXPECT_EQ(ask("status", "connections"), "1");
}

TEST_F(FaultsTest, Garbage) {
    const PacketSocket client = openClient();
    tell("fault command=26 garbage=5");
    EXPECT_EQ(call(client, kForbid), Bytes().fill(5, 0xa5).get());
    EXPECT_EQ(call(client, kAllow), kDone);
}

TEST_F(FaultsTest, EntryAbsentUntilItIsPresent) {
    const PacketSocket client = connect();
    const ByteVector byClass = request(2, 1, Bytes().text("Keystrand"));
    const ByteVector byPath = request(1, 1, Bytes().text(kEntryPath));
    tell("fault entry absent");
    EXPECT_EQ(exchange(client, byClass), reply(2, 1, 0, 0));
    EXPECT_EQ(exchange(client, byPath), reply(1, 1, 0, 0));
    EXPECT_EQ(exchange(client, propertyRequest(1, "P")), reply(3, 1, -6002, 0));
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, -6002, 0));
    tell("fault entry present");
    EXPECT_EQ(exchange(client, byClass), reply(2, 1, 0, 1, Bytes().text(kEntryPath)));
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, 0, 0));
}

TEST_F(FaultsTest, PropertyAbsentWithoutBeingRemoved) {
    const PacketSocket client = connect();
    tell("property set P 07");
    tell("fault property P absent");
    EXPECT_EQ(exchange(client, propertyRequest(1, "P")), reply(3, 1, 0, 0));
    EXPECT_EQ(ask("property get P", "handed-out"), "0");
    EXPECT_EQ(exchange(client, propertyRequest(1, "P")), reply(3, 1, 0, 1, {7}));
}

TEST_F(FaultsTest, RefusedConnections) {
    tell("fault refuse-connections times=2");
    EXPECT_TRUE(connect().awaitHangUp());
    EXPECT_TRUE(connect().awaitHangUp());
    EXPECT_EQ(exchange(connect(), propertyRequest(1, "P")), reply(3, 1, 0, 0));
}

TEST_F(FaultsTest, RefusedOpenLeavesTheConnectionUnopened) {
    const PacketSocket client = connect();
    tell("fault operation=open status=-77");
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, -77, 0));
    EXPECT_EQ(call(client, kAllow), reply(5, 2, -6003, 0));
    EXPECT_EQ(exchange(client, openRequest(1)), reply(4, 1, 0, 0));
}

TEST_F(FaultsTest, EveryOperationCanBeGivenAStatus) {
    const PacketSocket client = openClient();
    for (const char* name : {"find-path", "find-class", "property", "open", "struct", "scalar"}) {
        tell(std::string("fault operation=") + name + " status=-9 times=always");
    }
    for (std::uint8_t operation = 1; operation <= 6; ++operation) {
        EXPECT_EQ(exchange(client, request(operation, 1, {})), reply(operation, 1, -9, 0));
    }
    tell("fault clear");
    EXPECT_EQ(call(client, kAllow), kDone);
}

TEST_F(FaultsTest, OrdersThatMakeNoSense) {
    for (const char* order :
         {"fault", "fault command=26", "fault command=256 silence", "fault status=x",
          "fault operation=close silence", "fault silence times=0", "fault silence never",
          "fault property P", "fault entry gone", "fault delay=0", "fault delay=600001",
          "fault garbage=0"}) {
        EXPECT_FALSE(control_->command(order).ok) << order;
    }
    EXPECT_EQ(ask("status", "faults"), "0");
}

} // namespace

} // namespace keystrand::sim::test
