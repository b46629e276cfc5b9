#include "tests/kstd-https/ClientProgram.h"
#include "tests/support/Collector.h"

#include <gtest/gtest.h>

namespace {

using support::ConnectedClient;

std::optional<int> statusWith(const std::vector<std::string>& options) {
    ConnectedClient client(options);
    // Without a fault in the options it would wait for a request.
    client.hangUp();
    const auto status = client.awaitEnd();
    EXPECT_FALSE(client.lines().empty());
    return status;
}

TEST(HTTPSOptionsTest, WhatIsNotUnderstoodEndsTheProgram) {
    EXPECT_EQ(statusWith({"--help"}), 0);
    EXPECT_EQ(statusWith({}), 1) << "it waits for a request";
    for (const std::vector<std::string>& options : {std::vector<std::string>{"--no-such-option"},
                                                    {"word"},
                                                    {"--slow-limit"},
                                                    {"--slow-limit", "0"},
                                                    {"--slow-limit", "86401"},
                                                    {"--slow-limit", "soon"},
                                                    {"--connect-limit", "0"},
                                                    {"--connect-limit", "86401"},
                                                    {"--slowest-speed", "0"}}) {
        SCOPED_TRACE(testing::PrintToString(options));
        EXPECT_GE(statusWith(options), 100);
    }
    for (const std::vector<std::string>& options : {std::vector<std::string>{"--slow-limit", "1"},
                                                    {"--slow-limit", "86400"},
                                                    {"--connect-limit", "86400"},
                                                    {"--slowest-speed", "1"}}) {
        SCOPED_TRACE(testing::PrintToString(options));
        EXPECT_EQ(statusWith(options), 1);
    }
}

TEST(HTTPSOptionsTest, ConnectLimitIsKept) {
    support::Collector collector;
    collector.control("fault no-handshake");
    ConnectedClient client({"--connect-limit", "1"});
    const std::string link = collector.link("/");
    ASSERT_EQ(client.connection().send(*wire::encodeHTTPRequest({.method = "GET", .link = link})),
              wire::HTTPConnectionState::open);
    wire::HTTPMessage message;
    int working = 0;
    while (client.connection().receive(message) == wire::HTTPConnectionState::open &&
           message.type == wire::HTTPMessageType::working) {
        ++working;
    }
    ASSERT_EQ(message.type, wire::HTTPMessageType::failure);
    EXPECT_EQ(wire::decodeHTTPFailure(message.fields)->code, 3);
    EXPECT_GE(working, 1) << "it says that it is at work";
    EXPECT_EQ(client.awaitEnd(), 0);
}

} // namespace
