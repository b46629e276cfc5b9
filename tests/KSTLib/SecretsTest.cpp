// No copy of a credential outlives the call that carried it, whether the call succeeded or not.

#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Platform.h"
#include "KSTLib/Serialization.h"
#include "tests/support/MemoryScan.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScriptedGate.h"
#include "tests/support/ScriptedRegistry.h"
#include "tests/support/StandardOutputCapture.h"

#include <gtest/gtest.h>

#include <array>
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

constexpr support::OwnStack::TurnedWord kTurnedWord = {0x6a, 0x15, 0xc8, 0x37};

/// Fills memory with one word again and again, byte by byte, so that filling leaves no copy.
void fillWithSecret(void* memory, std::size_t size) {
    auto* bytes = static_cast<std::uint8_t*>(memory);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = static_cast<std::uint8_t>(~kTurnedWord[i % kTurnedWord.size()]);
    }
}

/// Fills every reply with secrets, and then succeeds or not.
class TalkativeChannel : public ForgetfulChannel {
  public:
    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* /*input*/,
                                std::size_t /*inputSize*/, void* output,
                                std::size_t* outputSize) override {
        fillWithSecret(output, *outputSize);
        return status;
    }
};

/// A library that is called on a stack of its own.
class SecretsOnTheStack : public testing::Test {
  protected:
    void SetUp() override {
        kst::installPlatform({log, registry, channel});
        fillWithSecret(secret.data(), secret.size());
        ASSERT_EQ(LibCall_KSTContextCreate(kst::channelTransport, &context, nullptr), 0);
    }

    void TearDown() override {
        static_cast<void>(KSTContextDelete(context, false));
        kst::removePlatform();
    }

    /// How many copies a call leaves behind that returns `expected`.
    std::size_t copiesAfter(const std::function<KSTStatus()>& call, KSTStatus expected) {
        support::OwnStack stack;
        KSTStatus seen = 0;
        stack.run([&] { seen = call(); });
        EXPECT_EQ(seen, expected);
        return stack.places(kTurnedWord);
    }

    static void look(const void* /*data*/, std::size_t /*length*/) {}

    support::RecordingLog log;
    support::ScriptedRegistry registry;
    TalkativeChannel channel;
    support::StandardOutputCapture output;
    std::array<std::uint8_t, 256> secret{};
    KSTContextRef context = nullptr;
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

TEST_F(SecretsOnTheStack, ScanFindsACopy) {
    EXPECT_EQ(copiesAfter([] { return 0; }, 0), 0U);
    EXPECT_EQ(copiesAfter(
                  [] {
                      std::uint8_t copy[9] = {};
                      fillWithSecret(copy, sizeof copy);
                      return 0;
                  },
                  0),
              2U);
}

TEST_F(SecretsOnTheStack, NoneOfARequestOrAReply) {
    struct Call {
        const char* name;
        std::function<KSTStatus()> call;
    };
    const Call kCalls[] = {
        {"contains type",
         [this] {
             return KSTContextContainsCredentialType(context, 1);
         }},
        {"contains passphrase",
         [this] {
             return KSTContextContainsPassphraseCredentialWithPurpose(context, 1, 0);
         }},
        {"create",
         [] {
             KSTContextRef made = nullptr;
             const KSTStatus status = KSTContextCreate(&made);
             return status == 0 ? KSTContextDelete(made, false) : status;
         }},
        {"create over a transport",
         [] {
             KSTContextRef made = nullptr;
             const KSTStatus status =
                 LibCall_KSTContextCreate(kst::channelTransport, &made, nullptr);
             return status == 0 ? KSTContextDelete(made, false) : status;
         }},
        {"open by external form",
         [this] {
             KSTContextRef same = KSTContextCreateWithExternalForm(secret.data(), 16);
             return same != nullptr ? KSTContextDelete(same, false) : channel.status;
         }},
        {"set variable",
         [this] {
             return KSTSetEnvironmentVariable(1, secret.data(), 64);
         }},
        {"get variable",
         [] {
             return KSTGetEnvironmentVariable(1, look);
         }},
        {"kernel control",
         [this] {
             return KSTKernelControl(1, secret.data(), secret.size(), look);
         }},
        {"parse",
         [this] {
             return KSTParseAclAndCopyConstraintCharacteristics(
                 secret.data(), secret.size(), [](KSTStatus, const void*, std::size_t) {});
         }},
    };
    for (const Call& call : kCalls) {
        for (const KSTStatus status : {0, -9}) {
            channel.status = status;
            EXPECT_EQ(copiesAfter(call.call, status), 0U) << call.name << ", status " << status;
        }
    }
}

TEST_F(SecretsOnTheStack, NoneOfACredentialThatIsReadAndWritten) {
    std::array<std::uint8_t, 168> bytes{};
    fillWithSecret(bytes.data(), bytes.size());
    const std::uint32_t type = kKSTCredentialTypePassphraseEntered;
    const std::uint32_t dataLength = 136;
    std::memcpy(bytes.data(), &type, sizeof type);
    std::memcpy(bytes.data() + 28, &dataLength, sizeof dataLength);
    const auto readAndWrite = [&bytes](std::size_t size) {
        KSTCredential* credential = nullptr;
        std::size_t consumed = 0;
        KSTStatus status = DeserializeCredential(bytes.data(), size, &credential, &consumed);
        if (status == 0) {
            std::size_t room = bytes.size();
            status = SerializeCredential(credential, bytes.data(), &room);
            DeallocCredential(credential);
        }
        return status;
    };
    EXPECT_EQ(copiesAfter([&] { return readAndWrite(bytes.size()); }, 0), 0U);
    EXPECT_EQ(copiesAfter([&] { return readAndWrite(bytes.size() - 1); }, -3), 0U);
}
