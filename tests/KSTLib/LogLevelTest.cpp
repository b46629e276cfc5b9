#include "KSTLib/KSTLib.h"
#include "KSTLib/Serialization.h"
#include "tests/KSTLib/ContextFixture.h"
#include "tests/common/CredentialSamples.h"
#include "tests/common/RequirementSamples.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <limits>
#include <utility>

namespace {

using support::Bytes;
using support::Lines;
using support::ScriptedChannel;

constexpr char kCalled[] = "KSTLib: KSTKernelControl: called.\n";
constexpr char kSucceeded[] = "KSTLib: KSTKernelControl: returning, err = 0.\n";
constexpr char kFailed[] = "KSTLib: KSTKernelControl: returning, err = -9.\n";
constexpr char kReturning[] = "KSTLib: updateLogLevel: returning.\n";

class LogLevel : public support::ChannelFixture {
  protected:
    /// The lines of one successful or failed call at `level`.
    Lines linesAt(int level, KSTStatus status) {
        log.clear();
        kst::gLogLevel = static_cast<std::uint8_t>(level);
        channel.structStatus = status;
        EXPECT_EQ(KSTKernelControl(1, nullptr, 0, nullptr), status);
        return logged();
    }

    Lines linesOfUpdate(std::vector<std::uint64_t> scalars) {
        log.clear();
        channel.scalars = std::move(scalars);
        kst::updateLogLevel();
        return logged();
    }
};

/// A public function in a call that succeeds and in one that fails.
struct Traced {
    const char* name;
    /// Whose return ends the call: its own, or that of the function that it hands over to.
    const char* returns;
    std::function<void()> succeed;
    std::function<void()> fail;
};

/// Every public function that can fail.
class TracedFunctions : public support::ContextFixture {
  protected:
    void SetUp() override {
        ContextFixture::SetUp();
        answers[3].reply = answers[11].reply = {1, 0, 0, 0};
        answers[4].reply = answers[13].reply = {1, 0, 0, 0};
    }

    /// A function that sends fails because the kernel side does.
    Traced sends(const char* name, const std::function<void()>& call,
                 const char* returns = nullptr) {
        return {name, returns != nullptr ? returns : name, call, [this, call] {
                    for (int code = 1; code <= 26; ++code) {
                        answers[code].status = -9;
                    }
                    call();
                    for (int code = 1; code <= 26; ++code) {
                        answers[code].status = 0;
                    }
                }};
    }

    [[nodiscard]] std::vector<Traced> sending() {
        const auto look = [](const void*, std::size_t) {
        };
        const auto take = [](bool, const KSTRequirement*) {
        };
        const auto learn = [](KSTStatus, bool, const KSTRequirement*) {
        };
        const auto learnOfBytes = [](KSTStatus, const void*, std::size_t) {
        };
        return {
            sends("KSTContextCreate",
                  [this] {
                      KSTContextRef made = nullptr;
                      if (KSTContextCreate(&made) == 0) {
                          deleteQuietly(made);
                      }
                  }),
            sends("KSTContextCreateWithExternalForm",
                  [this] {
                      KSTContextRef made = KSTContextCreateWithExternalForm(kHandle.data(), 16);
                      if (made != nullptr) {
                          deleteQuietly(made);
                          gAllocatedBytes += 1;
                      }
                  }),
            {"KSTContextDelete", "KSTContextDelete",
             [this] {
                 KSTContextRef made = openQuietly();
                 EXPECT_EQ(KSTContextDelete(made, true), 0);
             },
             [] {
                 EXPECT_EQ(KSTContextDelete(nullptr, true), -3);
             }},
            sends("KSTContextGetExternalForm",
                  [=, this] { KSTContextGetExternalForm(context, look); }),
            sends(
                "KSTContextAddCredential",
                [this] { static_cast<void>(KSTContextAddCredential(context, passphrase())); },
                "KSTContextAddCredentialWithScope"),
            sends(
                "KSTContextRemoveCredentialsByType",
                [this] { static_cast<void>(KSTContextRemoveCredentialsByType(context, 1)); },
                "KSTContextRemoveCredentialsByTypeAndScope"),
            sends(
                "KSTContextRemoveCredentialsByValue",
                [this] {
                    static_cast<void>(KSTContextRemoveCredentialsByValue(context, passphrase()));
                },
                "KSTContextRemoveCredentialsByValueAndScope"),
            sends(
                "KSTContextContainsCredentialType",
                [this] { static_cast<void>(KSTContextContainsCredentialType(context, 1)); },
                "KSTContextContainsCredentialTypeEx"),
            sends("KSTContextContainsPassphraseCredentialWithPurpose",
                  [this] {
                      static_cast<void>(
                          KSTContextContainsPassphraseCredentialWithPurpose(context, 1, 0));
                  }),
            sends("KSTContextRemovePassphraseCredentialsByPurposeAndScope",
                  [this] {
                      static_cast<void>(
                          KSTContextRemovePassphraseCredentialsByPurposeAndScope(context, 1, 1));
                  }),
            sends("KSTContextReplacePassphraseCredentialsWithScope",
                  [this] {
                      static_cast<void>(KSTContextReplacePassphraseCredentialsWithScope(
                          context, passphrase(), 1));
                  }),
            sends("KSTContextVerifyPolicy",
                  [=, this] { static_cast<void>(KSTContextVerifyPolicy(context, "p", take)); }),
            sends("KSTContextVerifyPolicyWithPreflight",
                  [=, this] {
                      static_cast<void>(
                          KSTContextVerifyPolicyWithPreflight(context, "p", true, take));
                  }),
            sends(
                "KSTContextVerifyPolicyEx",
                [=, this] { KSTContextVerifyPolicyEx(context, "p", false, nullptr, 0, 0, learn); }),
            sends("KSTContextVerifyAclConstraint",
                  [=, this] {
                      KSTContextVerifyAclConstraint(context, "c", 1, false, nullptr, 0, 0, learn);
                  }),
            sends("KSTParseAclAndCopyConstraintCharacteristics",
                  [=] { KSTParseAclAndCopyConstraintCharacteristics("a", 1, learnOfBytes); }),
        };
    }

    /// Those over the global context make one of their own, whose level byte is `level`.
    [[nodiscard]] std::vector<Traced> global() {
        const auto learn = [](KSTStatus, bool, const KSTRequirement*) {
        };
        const auto forgotten = [](const std::function<void()>& call) {
            return [call] {
                const std::int64_t before = gAllocatedBytes;
                call();
                gAllocatedBytes = before;
            };
        };
        return {
            sends("KSTGlobalContextAddCredential", forgotten([this] {
                      static_cast<void>(KSTGlobalContextAddCredential(passphrase()));
                  })),
            sends("KSTGlobalContextRemoveCredentialsByType",
                  forgotten([] { static_cast<void>(KSTGlobalContextRemoveCredentialsByType(1)); })),
            sends("KSTGlobalContextVerifyPolicy",
                  forgotten([=] { KSTGlobalContextVerifyPolicy("p", false, nullptr, 0, learn); })),
        };
    }

    /// Those that a LibCall function does the work for, which prints their failure.
    [[nodiscard]] std::vector<Traced> printing() {
        const auto look = [](const void*, std::size_t) {
        };
        return {
            sends("KSTSetEnvironmentVariable",
                  [] { static_cast<void>(KSTSetEnvironmentVariable(1, "a", 1)); }),
            sends("KSTGetEnvironmentVariable",
                  [=] { static_cast<void>(KSTGetEnvironmentVariable(1, look)); }),
            sends("KSTKernelControl",
                  [] { static_cast<void>(KSTKernelControl(1, "a", 1, KST_NO_BLOCK)); }),
            {"KSTCredentialCreate", "KSTCredentialCreate",
             [] {
                 KSTCredential* made = nullptr;
                 EXPECT_EQ(KSTCredentialCreate(4, &made), 0);
                 DeallocCredential(made);
             },
             [] {
                 KSTCredential* made = nullptr;
                 EXPECT_EQ(KSTCredentialCreate(13, &made), -3);
             }},
            {"KSTCredentialSetProperty", "KSTCredentialSetProperty",
             [this] { EXPECT_EQ(KSTCredentialSetProperty(passphrase(), 201, "abcd", 4), 0); },
             [this] {
                 EXPECT_EQ(KSTCredentialSetProperty(passphrase(), 201, "abc", 3), -3);
             }},
            {"KSTCredentialGetProperty", "KSTCredentialGetProperty",
             [=, this] { EXPECT_EQ(KSTCredentialGetProperty(passphrase(), 201, look), 0); },
             [=, this] {
                 EXPECT_EQ(KSTCredentialGetProperty(passphrase(), 999, look), -3);
             }},
            {"KSTRequirementGetProperty", "KSTRequirementGetProperty",
             [=, this] { EXPECT_EQ(KSTRequirementGetProperty(requirement(), 200, look), 0); },
             [=, this] {
                 EXPECT_EQ(KSTRequirementGetProperty(requirement(), 999, look), -3);
             }},
        };
    }

    /// One that fails in the library itself.
    [[nodiscard]] std::vector<Traced> silent() {
        const auto look = [](std::uint32_t, const void*, std::size_t) {
        };
        return {{"KSTRequirementGetProperties", "KSTRequirementGetProperties",
                 [=, this] { EXPECT_EQ(KSTRequirementGetProperties(requirement(), look), 0); },
                 [=] {
                     EXPECT_EQ(KSTRequirementGetProperties(nullptr, look), -3);
                 }}};
    }

    /// Which lines of the function a call writes at `level`: its entry, the return that ends it.
    std::pair<bool, bool> shownAt(int level, const Traced& traced,
                                  const std::function<void()>& call) {
        answers[1].reply.back() = answers[18].reply.back() = static_cast<std::uint8_t>(level);
        channel.scalars = {static_cast<std::uint64_t>(level)};
        kst::gLogLevel = static_cast<std::uint8_t>(level);
        log.clear();
        call();
        const Lines lines = logged();
        kst::gLogLevel = 40;
        // Only a check has a place in a source.
        for (const auto& line : log.lines()) {
            EXPECT_EQ(line.line == 0, line.text.find("AssertMacros") == std::string::npos);
        }
        const std::string returning = std::string("KSTLib: ") + traced.returns + ": returning, ";
        return {!lines.empty() && lines.front() == called(traced.name),
                !lines.empty() && lines.back().rfind(returning, 0) == 0};
    }

    void expectSeverities(const Traced& traced) {
        using Shown = std::pair<bool, bool>;
        SCOPED_TRACE(traced.name);
        EXPECT_EQ(shownAt(30, traced, traced.succeed), Shown(true, true));
        EXPECT_EQ(shownAt(31, traced, traced.succeed), Shown(false, false));
        EXPECT_EQ(shownAt(30, traced, traced.fail), Shown(true, true));
        EXPECT_EQ(shownAt(31, traced, traced.fail), Shown(false, true));
        EXPECT_EQ(shownAt(70, traced, traced.fail), Shown(false, true));
        EXPECT_EQ(shownAt(71, traced, traced.fail), Shown(false, false));
    }

    /// What a failure prints at the level that lets least through.
    std::string printedBy(const Traced& traced) {
        const std::string before = printed();
        static_cast<void>(shownAt(255, traced, traced.fail));
        static_cast<void>(shownAt(30, traced, traced.succeed));
        return printed().substr(before.size());
    }

    KSTCredential* passphrase() { return support::asCredential(credential_); }
    KSTRequirement* requirement() { return support::asRequirement(requirement_); }

  private:
    /// Without a line; the account keeps a byte of a context that was created.
    void deleteQuietly(KSTContextRef made) {
        const std::uint8_t level = std::exchange(kst::gLogLevel, std::uint8_t{255});
        EXPECT_EQ(KSTContextDelete(made, false), 0);
        gAllocatedBytes -= 1;
        kst::gLogLevel = level;
    }

    KSTContextRef openQuietly() {
        const std::uint8_t level = std::exchange(kst::gLogLevel, std::uint8_t{255});
        answers[18].reply.back() = 255;
        KSTContextRef made = KSTContextCreateWithExternalForm(kHandle.data(), 16);
        kst::gLogLevel = level;
        return made;
    }

    Bytes credential_ = support::credentialBytes(2);
    Bytes requirement_ = support::leafBytes(2, 4);
};

} // namespace

TEST_F(TracedFunctions, EntriesAndSuccessesHaveSeverity30AndFailures70) {
    for (const auto& functions : {sending(), global(), printing(), silent()}) {
        for (const Traced& traced : functions) {
            expectSeverities(traced);
        }
    }
}

TEST_F(TracedFunctions, OnlyThoseOfALibCallFunctionPrintTheirFailures) {
    for (const auto& functions : {sending(), global(), silent()}) {
        for (const Traced& traced : functions) {
            EXPECT_EQ(printedBy(traced), "") << traced.name;
        }
    }
    for (const Traced& traced : printing()) {
        const std::string text = printedBy(traced);
        EXPECT_EQ(text.rfind("KST: LibCall_KST", 0), 0U) << traced.name << ": " << text;
        EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 1) << traced.name << ": " << text;
    }
}

TEST_F(LogLevel, Successes) {
    for (const int level : {0, 29, 30}) {
        EXPECT_EQ(linesAt(level, 0), (Lines{kCalled, kSucceeded})) << level;
    }
    for (const int level : {31, 40, 70, 71, 255}) {
        EXPECT_EQ(linesAt(level, 0), Lines{}) << level;
    }
}

TEST_F(LogLevel, Failures) {
    const std::string check = failedCheck("err == 0 ", "0xfffffffffffffff7");
    const std::string transport = transportFailed(-9, "LibCallBlock");
    for (const int level : {0, 29, 30}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{kCalled, check, transport, kFailed})) << level;
    }
    for (const int level : {31, 40, 69, 70}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{check, transport, kFailed})) << level;
    }
    for (const int level : {71, 255}) {
        EXPECT_EQ(linesAt(level, -9), (Lines{check, transport})) << level;
    }
}

TEST_F(LogLevel, StandardOutputDoesNotAskTheLevel) {
    linesAt(255, -9);
    EXPECT_EQ(printed(), "KST: LibCall_KSTKernelControl_Block: returning, err = -9.\n");
}

TEST_F(LogLevel, LinesNameTheFunctionOnly) {
    linesAt(0, 0);
    ASSERT_EQ(log.lines().size(), 2U);
    for (const auto& line : log.lines()) {
        EXPECT_EQ(line.level, platform::LogLevel::info);
        EXPECT_EQ(line.function, "KSTKernelControl");
        EXPECT_EQ(line.line, 0);
    }
}

TEST_F(LogLevel, UpdateAsksTheKernel) {
    ASSERT_EQ(kst::init(), 0);
    linesOfUpdate({50});
    ASSERT_EQ(channel.scalarCalls.size(), 1U);
    const auto& call = channel.scalarCalls.front();
    EXPECT_EQ(call.connection, ScriptedChannel::kConnection);
    EXPECT_EQ(call.selector, 2U);
    EXPECT_EQ(call.inputCount, 0U);
    EXPECT_EQ(call.offeredCount, 1U);
    EXPECT_EQ(kst::gLogLevel, 50);
}

TEST_F(LogLevel, UpdateSaysLevelsBelow31) {
    for (const int level : {0, 1, 29, 30}) {
        EXPECT_EQ(
            linesOfUpdate({static_cast<std::uint64_t>(level)}),
            (Lines{"KSTLib: updateLogLevel: log level set to " + std::to_string(level) + ".\n",
                   kReturning}));
        EXPECT_EQ(kst::gLogLevel, level);
    }
    for (const int level : {31, 40, 70, 71, 255}) {
        EXPECT_EQ(linesOfUpdate({static_cast<std::uint64_t>(level)}), Lines{}) << level;
        EXPECT_EQ(kst::gLogLevel, level);
    }
}

TEST_F(LogLevel, UpdateTakesTheLowByte) {
    EXPECT_EQ(linesOfUpdate({0xffffffffffffff28}), Lines{});
    EXPECT_EQ(kst::gLogLevel, 0x28);
    EXPECT_EQ(linesOfUpdate({0x100}).size(), 2U);
    EXPECT_EQ(kst::gLogLevel, 0);
}

TEST_F(LogLevel, FailedUpdateChangesNothing) {
    channel.scalarStatus = -1110;
    const std::string check = failedCheck("err == 0 ", "0xfffffffffffffbaa");
    EXPECT_EQ(linesOfUpdate({10}), Lines{check});
    EXPECT_EQ(kst::gLogLevel, 40);

    kst::gLogLevel = 30;
    EXPECT_EQ(linesOfUpdate({10}), (Lines{check, kReturning}));
    EXPECT_EQ(kst::gLogLevel, 30);
}

TEST_F(LogLevel, UpdateThatGotNoNumberChangesNothing) {
    EXPECT_EQ(linesOfUpdate({}), Lines{failedCheck("outputCount == 1")});
    EXPECT_EQ(kst::gLogLevel, 40);
}

TEST_F(LogLevel, UpdateDoesNotOpenTheChannel) {
    linesOfUpdate({20});
    EXPECT_TRUE(registry.classesAsked.empty());
    EXPECT_TRUE(channel.opens.empty());
    EXPECT_FALSE(kst::gChannelOpen);
}
