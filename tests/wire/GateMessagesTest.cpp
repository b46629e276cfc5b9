#include "wire/GateMessages.h"

#include <gtest/gtest.h>

namespace wire {
namespace {

TEST(GateMessagesTest, EachRequestHasOneText) {
    const std::pair<GateRequest, std::string> kRequests[] = {
        {GateDevicesRequest(), "devices\n"},
        {GateStatusRequest(), "status\n"},
        {GateAcceptRequest{.port = "1-2.3", .number = 5, .inode = 18446744073709551615U},
         "accept 1-2.3 5 18446744073709551615\n"},
        {GateOpenRequest{.seconds = kMostGateOpenSeconds}, "open 604800\n"},
        {GateOpenRequest(), "open 0\n"}};
    for (const auto& [request, text] : kRequests) {
        EXPECT_EQ(encodeGateRequest(request), text);
        EXPECT_EQ(decodeGateRequest(text), request);
        for (std::size_t size = 0; size < text.size(); ++size) {
            EXPECT_EQ(decodeGateRequest(text.substr(0, size)), std::nullopt) << size;
        }
        EXPECT_EQ(decodeGateRequest(text + "\n"), std::nullopt);
    }
}

TEST(GateMessagesTest, AnythingElseIsNoRequest) {
    for (const char* text :
         {"\n", "other\n", "accept 1-1 5\n", "accept 1-1 5 6 7\n", "accept 1-1 05 6\n",
          "accept 1-1 4294967296 6\n", "accept  5 6\n", "open 604801\n", "open -1\n", "open\n",
          "open 5 \n", "devices status\n"}) {
        EXPECT_EQ(decodeGateRequest(text), std::nullopt) << text;
    }
}

GateDevices someDevices() {
    return {{.port = "1-1",
             .number = 2,
             .inode = 3,
             .vendor = 0x0781,
             .product = 65535,
             .manufacturer = std::string("a\0\n\xff", 4),
             .name = "Stick",
             .serial = {},
             .classes = "08/06/50,03/01/01",
             .accepted = false,
             .rule = "refused",
             .forSeconds = 12},
            {.port = "2-1", .accepted = true}};
}

TEST(GateMessagesTest, Devices) {
    const GateDevices devices = someDevices();
    const std::string text = encodeGateAnswer(devices);
    EXPECT_EQ(text, "devices\n"
                    "1-1 2 3 1921 65535 61000aff 537469636b - 08/06/50,03/01/01 out refused 12\n"
                    "2-1 0 0 0 0 - - - - in - 0\n");
    EXPECT_EQ(decodeGateAnswer(text), GateAnswer(devices));
    EXPECT_EQ(decodeGateAnswer(encodeGateAnswer(GateDevices())), GateAnswer(GateDevices()));
}

TEST(GateMessagesTest, DevicesHaveALimitAndSoHaveTheirTexts) {
    GateDevices many(kMostGateDevices + 1, someDevices()[0]);
    many[0].name = std::string(kMostGateText + 1, 'n');
    many[1].serial = std::string(kMostGateText, 's');
    const std::string text = encodeGateAnswer(many);
    EXPECT_LE(text.size(), kGateAnswerSize);
    const auto answer = decodeGateAnswer(text);
    ASSERT_TRUE(answer);
    const auto& devices = std::get<GateDevices>(*answer);
    EXPECT_EQ(devices.size(), kMostGateDevices);
    EXPECT_EQ(devices[0].name, std::string(kMostGateText, 'n'));
    EXPECT_EQ(devices[1].serial, many[1].serial);
    EXPECT_EQ(decodeGateAnswer(text + text.substr(text.rfind('\n', text.size() - 2) + 1)),
              std::nullopt);
}

TEST(GateMessagesTest, LargestAnswerFits) {
    GateDevice largest{.port = std::string(32, '1'),
                       .number = 4294967295,
                       .inode = 18446744073709551615U,
                       .vendor = 65535,
                       .product = 65535,
                       .manufacturer = std::string(kMostGateText, 'x'),
                       .name = std::string(kMostGateText, 'x'),
                       .serial = std::string(kMostGateText, 'x'),
                       .classes = std::string(500, 'x'),
                       .rule = "refused-by-others",
                       .forSeconds = 18446744073709551615U};
    EXPECT_LE(encodeGateAnswer(GateDevices(kMostGateDevices, largest)).size(), kGateAnswerSize);
}

TEST(GateMessagesTest, Status) {
    const GateStatus status{.locked = true,
                            .restricted = true,
                            .closed = true,
                            .allowed = false,
                            .untilRestricted = 3600,
                            .untilClosed = 0,
                            .refused = 2};
    const std::string text = encodeGateAnswer(status);
    EXPECT_EQ(text, "status\nlocked yes\nstarting no\nsleeping no\nrestricted yes\nclosed yes\n"
                    "allowed no\npassword-set yes\nboot-argument no\nuntil-restricted 3600\n"
                    "until-closed 0\nrefused 2\n");
    EXPECT_EQ(decodeGateAnswer(text), GateAnswer(status));
    const GateStatus partly{.closed = true, .gap = "usb2"};
    EXPECT_EQ(encodeGateAnswer(partly),
              encodeGateAnswer(GateStatus{.closed = true}) + "gap 75736232\n");
    EXPECT_EQ(decodeGateAnswer(encodeGateAnswer(partly)), GateAnswer(partly));
    EXPECT_EQ(encodeGateAnswer(GateStatus()),
              "status\nlocked no\nstarting no\nsleeping no\nrestricted no\nclosed no\nallowed yes\n"
              "password-set yes\nboot-argument no\nrefused 0\n");
    EXPECT_EQ(decodeGateAnswer(encodeGateAnswer(GateStatus())), GateAnswer(GateStatus()));
}

TEST(GateMessagesTest, DoneAndRefused) {
    EXPECT_EQ(encodeGateAnswer(GateDone()), "ok\n");
    EXPECT_EQ(decodeGateAnswer("ok\n"), GateAnswer(GateDone()));
    const GateRefusal refusal{"the device is not there any more"};
    EXPECT_EQ(encodeGateAnswer(refusal), "error the device is not there any more\n");
    EXPECT_EQ(decodeGateAnswer(encodeGateAnswer(refusal)), GateAnswer(refusal));
}

TEST(GateMessagesTest, NothingShorterAndNothingElseIsAnAnswer) {
    for (const GateAnswer& answer :
         {GateAnswer(someDevices()), GateAnswer(GateStatus()), GateAnswer(GateDone())}) {
        const std::string text = encodeGateAnswer(answer);
        for (std::size_t size = 0; size < text.size(); ++size) {
            const auto read = decodeGateAnswer(text.substr(0, size));
            // A list of fewer devices is a list.
            EXPECT_TRUE(!read ||
                        (std::holds_alternative<GateDevices>(*read) && text[size - 1] == '\n'))
                << text.substr(0, size);
        }
    }
    for (const char* text :
         {"", "\n", "ok", "ok\n\n", "error ", "error", "devices\n1-1\n",
          "devices\n2-1 0 0 0 0 - - - - maybe - 0\n", "devices\n2-1 0 0 0 0 6 - - - in - 0\n",
          "devices\n2-1 0 0 0 0 6g - - - in - 0\n", "devices\n2-1 0 0 0 0 g6 - - - in - 0\n",
          "devices\n2-1 x 0 0 0 61 - - - in - 0\n", "devices\n2-1 0 0 65536 0 - - - - in - 0\n",
          "status\nother yes\n", "status\nlocked maybe\n"}) {
        EXPECT_EQ(decodeGateAnswer(text), std::nullopt) << text;
    }
}

} // namespace
} // namespace wire
