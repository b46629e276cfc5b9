#pragma once

#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/support/ScriptedGate.h"

#include <functional>
#include <map>

namespace support {

/// A library with one context of the handle 1 to 16 and a kernel side that answers by command.
class ContextFixture : public ChannelFixture {
  protected:
    struct Answer {
        KSTStatus status = 0;
        Bytes reply;
    };

    void SetUp() override {
        ChannelFixture::SetUp();
        channel.duringStructCall = [this] {
            const Answer& answer = answers[channel.structCalls.back().input.at(4)];
            channel.structStatus = answer.status;
            channel.reply = answer.reply;
        };
        answers[18].reply = {1, 0, 0, 0, 40};
        context = KSTContextCreateWithExternalForm(kHandle.data(), kHandle.size());
        ASSERT_NE(context, nullptr);
        channel.structCalls.clear();
        answers[1].reply = kOtherHandle;
        answers[1].reply.push_back(40);
    }

    void TearDown() override {
        if (context != nullptr) {
            EXPECT_EQ(KSTContextDelete(context, false), 0);
        }
        ChannelFixture::TearDown();
    }

    /// The frame of a command.
    static Bytes frame(std::uint8_t code, const Bytes& payload) {
        Bytes bytes = {'D', 'R', 'C', 'S', code, 0, 0, 0};
        bytes.insert(bytes.end(), payload.begin(), payload.end());
        return bytes;
    }

    /// `first` and then `second`.
    static Bytes joined(Bytes first, const Bytes& second) {
        first.insert(first.end(), second.begin(), second.end());
        return first;
    }

    /// The frames that were sent since the last look.
    std::vector<Bytes> sent() {
        std::vector<Bytes> frames;
        for (const auto& call : channel.structCalls) {
            frames.push_back(call.input);
        }
        channel.structCalls.clear();
        return frames;
    }

    void expectLogged(const Lines& lines) {
        EXPECT_EQ(logged(), lines);
        log.clear();
    }

    /// The line of a return of a function of the library.
    static std::string returned(const std::string& function, KSTStatus status) {
        std::string line = "KSTLib: ";
        line += function;
        line += ": returning, err = " + std::to_string(status) + ".\n";
        return line;
    }

    static std::string called(const std::string& function) {
        std::string line = "KSTLib: ";
        line += function;
        line += ": called.\n";
        return line;
    }

    /// The line of a call that returned -9, which is what the tests let the kernel side fail with.
    static std::string failedWith9() { return failedCheck("err == 0 ", "0xfffffffffffffff7"); }

    static std::string serializerCheck(const std::string& condition,
                                       const std::string& value = "0x0") {
        std::string line = "KST: AssertMacros: ";
        line += condition;
        line += " (value: " + value + "),  file: common/LibSerialization:<n>\n";
        return line;
    }

    /// Lets each allocation of `call` fail in turn, until it succeeds: kKSTErrorOutOfMemory, with
    /// nothing left behind. Returns how many there were.
    std::size_t failEachAllocation(const std::function<KSTStatus()>& call) {
        for (std::size_t refused = 0;; ++refused) {
            const std::int64_t before = gAllocatedBytes;
            const ScriptedGate gate(refused);
            const KSTStatus status = call();
            EXPECT_TRUE(gate.everyFreeWasWiped);
            if (gate.asked.size() <= refused) {
                EXPECT_EQ(status, 0);
                return refused;
            }
            EXPECT_EQ(status, kKSTErrorOutOfMemory) << "allocation " << refused;
            EXPECT_EQ(gAllocatedBytes, before) << "allocation " << refused;
        }
    }

    static inline const Bytes kHandle = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
    static inline const Bytes kOtherHandle = Bytes(16, 0xc1);
    std::map<int, Answer> answers;
    KSTContextRef context = nullptr;
};

} // namespace support
