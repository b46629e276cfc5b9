#pragma once

#include "base/Concat.h"
#include "platform/host/HTTPRequests.h"
#include "platform/https/HTTPTransfer.h"
#include "tests/support/Collector.h"
#include "tests/support/HTTPRequests.h"

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <string_view>

namespace support {

/// Gives the body of a request, as much as there is room for at a time, and goes on waiting.
class PatientCaller final : public platform::HTTPCaller {
  public:
    /// The body must outlive it.
    explicit PatientCaller(std::string_view body) : size_(body.size()), left_(body) {}

    [[nodiscard]] std::uint64_t bodySize() const override { return size_; }
    [[nodiscard]] std::size_t giveBody(std::span<char> room) override {
        const std::size_t given = left_.copy(room.data(), room.size());
        left_.remove_prefix(given);
        return given;
    }
    [[nodiscard]] bool isWaiting() override { return true; }

  private:
    std::uint64_t size_;
    std::string_view left_;
};

/// The reply to a request, made as the HTTPS client makes it.
[[nodiscard]] inline platform::HTTPReply transfer(const platform::HTTPRequest& request,
                                                  const platform::HTTPTransferSettings& settings) {
    if (auto refusal = platform::refusalOf(request)) {
        return *std::move(refusal);
    }
    PatientCaller caller(request.body);
    return platform::HTTPTransfer(request, settings, caller).perform();
}

/// A collector, and requests that trust it.
class HTTPTransferFixture : public testing::Test {
  protected:
    using Delegate = std::shared_ptr<platform::HTTPSessionDelegate>;

    void control(const std::string& line) { static_cast<void>(collector_.control(line)); }

    [[nodiscard]] std::string link() const { return collector_.link("/2/kst"); }

    [[nodiscard]] platform::HTTPReply fetch(const platform::HTTPRequest& request,
                                            const Delegate& delegate = nullptr) const {
        return transfer(request, {{{"User-Agent", "kstd/1.0"}}, delegate, options()});
    }
    [[nodiscard]] platform::HTTPReply getFrom(const std::string& link,
                                              const Delegate& delegate = nullptr) const {
        return fetch(get(link), delegate);
    }
    [[nodiscard]] platform::HTTPReply getIt(const Delegate& delegate = nullptr) const {
        return getFrom(link(), delegate);
    }
    [[nodiscard]] platform::HTTPReply postIt(std::string_view body) const {
        return fetch(post(link(), body));
    }

    /// Options that trust the collector.
    [[nodiscard]] platform::HTTPOptions options(const platform::HTTPLimits& limits = {}) const {
        return {collector_.authority(), limits};
    }

    Collector collector_;
};

} // namespace support
