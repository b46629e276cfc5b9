#pragma once

#include "base/Concat.h"
#include "platform/https/LinuxHTTPSessions.h"
#include "tests/support/Collector.h"
#include "tests/support/HTTPRequests.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <string_view>

namespace support {

/// Sessions of the Linux host and a collector that they trust.
class LinuxHTTPFixture : public testing::Test {
  protected:
    using Delegate = std::shared_ptr<platform::HTTPSessionDelegate>;

    void control(const std::string& line) { static_cast<void>(collector_.control(line)); }

    [[nodiscard]] std::string link() const { return collector_.link("/2/kst"); }

    [[nodiscard]] platform::HTTPReply getFrom(const std::string& link,
                                              const Delegate& delegate = nullptr) {
        return fetch(sessions_, get(link), delegate);
    }
    [[nodiscard]] platform::HTTPReply getIt(const Delegate& delegate = nullptr) {
        return getFrom(link(), delegate);
    }
    [[nodiscard]] platform::HTTPReply postIt(std::string_view body) {
        return fetch(sessions_, post(link(), body));
    }

    /// Options that trust the collector.
    [[nodiscard]] platform::LinuxHTTPOptions options() const {
        platform::LinuxHTTPOptions options;
        options.trustAnchors = collector_.authority();
        return options;
    }

    Collector collector_;
    platform::LinuxHTTPSessions sessions_{options()};
};

} // namespace support
