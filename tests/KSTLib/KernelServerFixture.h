#pragma once

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Platform.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/support/LibraryFixture.h"
#include "tests/support/SeqpacketServer.h"
#include "tests/support/TemporaryDirectory.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace support {

/// The library on the real connection, to a kernel side in this process whose answers a test gives.
class KernelServerFixture : public LibraryFixture {
  protected:
    using Peer = SeqpacketServer::Peer;

    /// What arrived: the command's code, or minus the operation of what is no command.
    struct Seen {
        int connection;
        int code;
        std::uint64_t sequence;
    };
    static constexpr int kFind = -2;
    static constexpr int kOpen = -4;
    static constexpr int kLogLevel = -6;
    /// The client hung up.
    static constexpr int kEnd = 0;

    static constexpr std::chrono::milliseconds kPatient{20000};

    void SetUp() override {
        LibraryFixture::SetUp();
        server_.emplace(path_, [this](const Peer& peer) { serve(peer); });
        channel_.emplace(path_, registry_, log, kPatient);
        ahead_.store({});
        kst::installPlatform({log, registry_, *channel_, callTime_});
    }

    void TearDown() override {
        kst::removePlatform();
        server_.reset();
        LibraryFixture::TearDown();
    }

    /// Lets a call of the library that begins from now on wait no longer than that.
    void setCallLimit(std::chrono::milliseconds limit) { callTime_.limit = limit; }

    /// From now on the time of each call that has begun is over.
    static void outlastTheCall() {
        while (!kst::isTimeUp()) {
            ahead_.store(ahead_.load() + kPatient);
        }
    }

    KSTContextRef openContext() {
        constexpr std::uint8_t kHandle[16] = {1, 2, 3};
        return KSTContextCreateWithExternalForm(kHandle, sizeof kHandle);
    }

    /// Whether `context` satisfies the policy, or the status of the call. The kernel side says so
    /// of "yes" only.
    static int ask(KSTContextRef context, const char* policy) {
        int answer = -1;
        const KSTStatus status =
            KSTContextVerifyPolicy(context, policy, [&](bool satisfied, const KSTRequirement*) {
                answer = satisfied ? 1 : 0;
            });
        return status == 0 ? answer : status;
    }

    /// What has arrived, without the lookups, the opening and the ends.
    std::vector<int> commands() {
        const std::lock_guard lock(mutex_);
        std::vector<int> codes;
        for (const Seen& seen : seen_) {
            if (seen.code > 0 || seen.code == kLogLevel) {
                codes.push_back(seen.code);
            }
        }
        return codes;
    }

    std::vector<Seen> seen() {
        const std::lock_guard lock(mutex_);
        return seen_;
    }

    /// Waits until that many of the code have arrived; false when patience ends.
    bool await(int code, std::ptrdiff_t count = 1) {
        std::unique_lock lock(mutex_);
        return arrived_.wait_for(lock, std::chrono::seconds(30), [&] {
            return std::count_if(seen_.begin(), seen_.end(),
                                 [&](const Seen& seen) { return seen.code == code; }) >= count;
        });
    }

    using Handler = std::function<bool(const Peer&, int code, const Packet& request)>;

    /// A handler that a test sets while the server's threads ask for it.
    class SharedHandler {
      public:
        SharedHandler& operator=(Handler handler) {
            const std::lock_guard lock(mutex_);
            handler_ = std::move(handler);
            return *this;
        }
        [[nodiscard]] Handler get() const {
            const std::lock_guard lock(mutex_);
            return handler_;
        }

      private:
        mutable std::mutex mutex_;
        Handler handler_;
    };

    /// Handles what has arrived in place of the usual answer; false leaves it to that.
    SharedHandler handle;
    /// Requests are overwritten as soon as they were looked at.
    std::atomic<bool> wipesRequests = false;

  private:
    static int codeOf(const Packet& request) {
        constexpr std::size_t kCodeOffset = 16 + 8 + 4;
        return request[5] == 5 && request.size() > kCodeOffset ? request[kCodeOffset] : -request[5];
    }

    static Packet answerTo(int code, const Packet& request) {
        using namespace std::string_literals;
        const auto sized = [&](const std::string& body) {
            return reply(request, 0, static_cast<std::uint32_t>(body.size()), body);
        };
        switch (code) {
        case kFind:
            return reply(request, 0, 1, "/entry");
        case kLogLevel:
            return reply(request, 0, 1, "\x28\0\0\0\0\0\0\0"s);
        case 1:
            return sized("0123456789abcdef\x28");
        case 18:
            return sized("\1\0\0\0\x28"s);
        case 3: {
            const std::string_view text(reinterpret_cast<const char*>(request.data()),
                                        request.size());
            const bool satisfied = text.find("yes") != std::string_view::npos;
            // Not satisfied, and nothing is missing: a requirement of type 1 without data.
            return sized(satisfied ? "\1\0\0\0"s : "\0\0\0\0"s + "\1" + std::string(15, 0));
        }
        default:
            return sized("");
        }
    }

    void note(const Seen& seen) {
        const std::lock_guard lock(mutex_);
        seen_.push_back(seen);
        arrived_.notify_all();
    }

    void serve(const Peer& peer) {
        const int connection = ++connections_;
        for (Packet request = peer.receive(); !request.empty(); request = peer.receive()) {
            const int code = codeOf(request);
            if (wipesRequests) {
                std::fill(request.begin() + 16, request.end(), std::uint8_t{0});
            }
            note({connection, code, request[8]});
            const Handler handler = handle.get();
            if (!handler || !handler(peer, code, request)) {
                peer.send(answerTo(code, request));
            }
        }
        note({connection, kEnd, 0});
    }

    static std::chrono::steady_clock::time_point now() {
        return std::chrono::steady_clock::now() + ahead_.load();
    }

    /// How far the library's clock is ahead of the one by which the connection waits.
    static inline std::atomic<std::chrono::milliseconds> ahead_{};

    TemporaryDirectory directory_;
    std::string path_ = directory_.file("service.sock");
    platform::LinuxServiceRegistry registry_{path_, log, kPatient};
    kst::CallTime callTime_{kPatient, now};
    std::optional<platform::LinuxKernelChannel> channel_;
    std::mutex mutex_;
    std::condition_variable arrived_;
    std::vector<Seen> seen_;
    std::atomic<int> connections_ = 0;
    std::optional<SeqpacketServer> server_;
};

} // namespace support
