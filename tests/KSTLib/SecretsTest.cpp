// No copy of a credential outlives the call that carried it, whether the call succeeded or not.

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/Platform.h"
#include "tests/support/MemoryScan.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScriptedGate.h"
#include "tests/support/ScriptedRegistry.h"
#include "tests/support/StandardOutputCapture.h"

#include <gtest/gtest.h>

#include <functional>
#include <memory>

namespace {

using support::MemoryScan;
using support::ScriptedGate;

constexpr MemoryScan::Turned kTurnedSecret = {0x13, 0x9e, 0x47, 0xc2, 0x5b, 0x08, 0xf1, 0x6d,
                                              0xa4, 0x3c, 0x90, 0xe7, 0x2a, 0x7f, 0xd5, 0x81};

/// Answers with success or not and keeps nothing of what it is sent.
class ForgetfulChannel : public platform::KernelChannel {
  public:
    platform::Status status = 0;

    platform::Status open(platform::ServiceHandle /*service*/, std::uint32_t /*connectionType*/,
                          platform::ConnectionHandle* connection) override {
        *connection = 1;
        return 0;
    }
    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* input,
                                std::size_t /*inputSize*/, void* output,
                                std::size_t* outputSize) override {
        const int code = static_cast<const std::uint8_t*>(input)[4];
        *outputSize = code == 1 ? 17 : code == 18 ? 5 : code == 3 || code == 11 ? 4 : 0;
        if (*outputSize > 0) {
            std::memset(output, 40, *outputSize);
        }
        return code == 18 || code == 1 ? 0 : status;
    }
    platform::Status scalarCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const std::uint64_t* /*inputs*/,
                                std::uint32_t /*inputCount*/, std::uint64_t* outputs,
                                std::uint32_t* /*outputCount*/) override {
        *outputs = 40;
        return 0;
    }
};

class Secrets : public testing::Test {
  protected:
    void SetUp() override {
        // A function that is bound at its first call has the registers saved on the stack, also
        // those through which a secret went last. What the scan calls is bound before there is one.
        static_cast<void>(scan->places());
        kst::installPlatform({log, registry, channel});
        const std::uint8_t form[16] = {};
        context = KSTContextCreateWithExternalForm(form, sizeof form);
        ASSERT_NE(context, nullptr);
        ASSERT_EQ(KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential), 0);
        // The caller's own copy, which is the one that stays.
        auto* passphrase = reinterpret_cast<std::uint8_t*>(credential + 1) + 8;
        for (std::size_t i = 0; i < kTurnedSecret.size(); ++i) {
            passphrase[i] = static_cast<std::uint8_t>(~kTurnedSecret[i]);
        }
    }

    void TearDown() override {
        KSTCredentialDelete(credential);
        static_cast<void>(KSTContextDelete(context, false));
        kst::removePlatform();
    }

    [[nodiscard]] std::size_t copies() { return scan->places() - 1; }

    support::RecordingLog log;
    support::ScriptedRegistry registry;
    ForgetfulChannel channel;
    support::StandardOutputCapture output;
    std::unique_ptr<MemoryScan> scan = std::make_unique<MemoryScan>(kTurnedSecret);
    KSTContextRef context = nullptr;
    KSTCredential* credential = nullptr;
};

} // namespace

TEST_F(Secrets, ScanFindsACopy) {
    EXPECT_EQ(copies(), 0U);
    KSTCredential* copy = nullptr;
    ASSERT_EQ(CopyCredential(credential, &copy), 0);
    EXPECT_EQ(copies(), 1U);
    DeallocCredential(copy);
    EXPECT_EQ(copies(), 0U);
}

TEST_F(Secrets, NoneAfterAnyCommand) {
    const std::function<KSTStatus()> kCalls[] = {
        [this] { return KSTContextAddCredential(context, credential); },
        [this] { return KSTContextRemoveCredentialsByValue(context, credential); },
        [this] { return KSTContextReplacePassphraseCredentialsWithScope(nullptr, credential, 2); },
        [this] { return KSTGlobalContextAddCredential(credential); },
        [this] {
            return LibCall_KSTContexAddCredentialWithScope(kst::channelTransport, context,
                                                           credential, 1);
        },
        [this] {
            const KSTParameter secret = {2, reinterpret_cast<std::uint8_t*>(credential + 1) + 8,
                                         16};
            KSTStatus seen = 0;
            KSTContextVerifyPolicyEx(context, "p", false, &secret, 1, 0,
                                     [&](KSTStatus status, bool, const void*) { seen = status; });
            return seen;
        },
        [this] {
            KSTStatus seen = 0;
            KSTContextVerifyAclConstraint(
                context, reinterpret_cast<std::uint8_t*>(credential + 1) + 8, 16, false, nullptr, 0,
                0, [&](KSTStatus status, bool, const void*) { seen = status; });
            return seen;
        },
    };
    for (const auto& call : kCalls) {
        channel.status = 0;
        EXPECT_EQ(call(), 0);
        EXPECT_EQ(copies(), 0U);
        channel.status = -9;
        EXPECT_EQ(call(), -9);
        EXPECT_EQ(copies(), 0U);
        for (std::size_t refused = 0; refused < 4; ++refused) {
            const ScriptedGate gate(refused);
            EXPECT_NE(call(), 0);
            EXPECT_EQ(copies(), 0U) << refused;
        }
    }
}

TEST_F(Secrets, NoneAfterReading) {
    std::size_t size = 188;
    auto payload = std::make_unique<std::uint8_t[]>(size);
    ASSERT_EQ(SerializeAddCredential(nullptr, credential, 2, payload.get(), &size), 0);
    EXPECT_EQ(copies(), 1U);
    for (const std::size_t length : {std::size_t{186}, size}) {
        KSTHandle handle{};
        KSTCredential* read = nullptr;
        KSTScope scope = 0;
        if (DeserializeAddCredential(payload.get(), length, &handle, &read, &scope) == 0) {
            EXPECT_EQ(copies(), 2U);
            DeallocCredential(read);
        }
        EXPECT_EQ(copies(), 1U);
    }
    ::explicit_bzero(payload.get(), size);
    EXPECT_EQ(copies(), 0U);
}
