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
    const auto expectFault = [](const std::vector<std::string>& options) {
        SCOPED_TRACE(testing::PrintToString(options));
        EXPECT_GE(statusWith(options), 100);
    };
    expectFault({"--no-such-option"});
    expectFault({"word"});
    expectFault({"--slow-limit", "60"});
    expectFault({"--send-limit"});
    expectFault({"--send-limit", "0"});
    expectFault({"--send-limit", "0.0009"});
    expectFault({"--send-limit", "soon"});
    for (const char* const limit :
         {"--connect-limit", "--fetch-limit", "--send-limit", "--answer-limit"}) {
        expectFault({limit, "86401"});
        for (const char* const seconds : {"0.001", "1", "86400"}) {
            EXPECT_EQ(statusWith({limit, seconds}), 1) << limit << ' ' << seconds;
        }
    }
}

TEST(HTTPSOptionsTest, LimitsAreKept) {
    const struct {
        const char* option;
        const char* method;
        const char* fault;
    } kCases[] = {
        {"--connect-limit", "GET", "no-handshake"},
        {"--fetch-limit", "GET", "never-answers"},
        {"--answer-limit", "POST", "never-answers"},
    };
    support::Collector collector(support::Collector::Protocol::http);
    const std::string link = collector.link("/");
    for (const auto& [option, method, fault] : kCases) {
        SCOPED_TRACE(option);
        collector.control(base::concat("fault ", fault));
        const bool isHandshake = fault == std::string("no-handshake");
        ConnectedClient client({option, "1"});
        const std::string secure = "https" + link.substr(4);
        ASSERT_EQ(client.connection().send(*wire::encodeHTTPRequest(
                      {.method = method, .link = isHandshake ? secure : link})),
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
}

} // namespace
