#include "KSTLib/Contexts.h"

#include "tests/KSTLib/ContextFixture.h"
#include "tests/support/RecordingBlock.h"

#include <gtest/gtest.h>

#include <cinttypes>
#include <cstdio>

namespace {

using support::Bytes;
using support::Lines;
using support::ScriptedGate;

class Contexts : public support::ContextFixture {
  protected:
    /// The line of KSTContextCreateWithExternalForm.
    static std::string returnedReference(const void* reference) {
        char line[100];
        std::snprintf(line, sizeof line,
                      "KSTLib: KSTContextCreateWithExternalForm: returning, ref = %p.\n",
                      reference);
        return line;
    }

    KSTContextRef openContext() {
        return KSTContextCreateWithExternalForm(kHandle.data(), kHandle.size());
    }

    /// The account keeps one byte of every context from KSTContextCreate.
    static void forgetTheSeventeenthByte() { gAllocatedBytes -= 1; }

    support::RecordingBlock block;
};

} // namespace

TEST_F(Contexts, CreateAndDelete) {
    const std::int64_t before = gAllocatedBytes;
    const ScriptedGate gate;
    KSTContextRef created = nullptr;
    ASSERT_EQ(KSTContextCreate(&created), 0);
    EXPECT_EQ(gAllocatedBytes, before + 17);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.input, frame(1, {}));
    EXPECT_EQ(call.offeredSize, 17U);
    EXPECT_TRUE(call.outputWasZero);
    channel.structCalls.clear();
    EXPECT_EQ(KSTContextDelete(created, true), 0);
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(2, kOtherHandle)});
    EXPECT_EQ(gAllocatedBytes, before + 1);
    EXPECT_TRUE(gate.everyFreeWasWiped);
    EXPECT_EQ(gate.freed.back(), 16U);
    expectLogged({});
    forgetTheSeventeenthByte();
}

TEST_F(Contexts, CreateTakesTheLevelOver) {
    for (const int level : {0, 30, 31, 255}) {
        answers[1].reply.back() = static_cast<std::uint8_t>(level);
        KSTContextRef created = nullptr;
        kst::gLogLevel = 40;
        ASSERT_EQ(KSTContextCreate(&created), 0);
        EXPECT_EQ(kst::gLogLevel, level);
        if (level < 31) {
            std::string set = "KSTLib: KSTContextCreate: log level set to ";
            set += std::to_string(level) + ".\n";
            expectLogged({set, returned("KSTContextCreate", 0)});
        } else {
            expectLogged({});
        }
        kst::gLogLevel = 40;
        EXPECT_EQ(KSTContextDelete(created, false), 0);
        forgetTheSeventeenthByte();
    }
}

TEST_F(Contexts, CreateWithoutAPlaceForIt) {
    channel.scalars = {40};
    EXPECT_EQ(KSTContextCreate(nullptr), -3);
    EXPECT_TRUE(sent().empty());
    EXPECT_EQ(channel.scalarCalls.size(), 1U);
    EXPECT_EQ(log.lines().front().file, "KSTLib/Contexts.cpp");
    expectLogged({failedCheck("context"), returned("KSTContextCreate", -3)});
}

TEST_F(Contexts, CreateThatFailsAsksForTheLevel) {
    channel.scalars = {50};
    answers[1].status = -9;
    const std::int64_t before = gAllocatedBytes;
    KSTContextRef created = context;
    EXPECT_EQ(KSTContextCreate(&created), -9);
    EXPECT_EQ(created, context);
    EXPECT_EQ(gAllocatedBytes, before);
    EXPECT_EQ(kst::gLogLevel, 50);
    EXPECT_EQ(channel.scalarCalls.size(), 1U);
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextCreate", -9)});
}

TEST_F(Contexts, CreateRepliesOfTheWrongSize) {
    channel.scalars = {40};
    const ScriptedGate gate;
    KSTContextRef created = nullptr;
    for (const std::size_t size : {0U, 16U}) {
        channel.reportedSize = size;
        channel.scalarCalls.clear();
        EXPECT_EQ(KSTContextCreate(&created), -5);
        EXPECT_EQ(channel.scalarCalls.size(), 1U);
        expectLogged({failedCheck("outSize == sizeof(KSTHandle) + sizeof(uint8_t)"),
                      returned("KSTContextCreate", -5)});
        EXPECT_EQ(gate.freed.back(), 17U);
    }
    channel.reportedSize = 18;
    EXPECT_EQ(KSTContextCreate(&created), -5);
    expectLogged({failedCheck("replySize <= offeredSize"),
                  failedCheck("err == 0 ", "0xfffffffffffffffb"),
                  returned("KSTContextCreate", -5)});
    EXPECT_EQ(created, nullptr);
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(Contexts, AbsentServiceIsNotAskedForTheLevel) {
    kst::installPlatform({log, registry, channel});
    registry.present = false;
    KSTContextRef created = nullptr;
    EXPECT_EQ(KSTContextCreate(&created), -5);
    expectLogged({failedCheck("service"), failedCheck("err == 0 ", "0xfffffffffffffffb"),
                  returned("KSTContextCreate", -5)});
    EXPECT_EQ(openContext(), nullptr);
    expectLogged({failedCheck("service"), failedCheck("err == 0 ", "0xfffffffffffffffb"),
                  returnedReference(nullptr)});
    EXPECT_EQ(KSTContextDelete(context, true), -5);
    KSTContextGetExternalForm(context, block);
    EXPECT_TRUE(block.calls.empty());
    EXPECT_TRUE(channel.scalarCalls.empty());
}

// The return is shown or not by the level that the failure has brought, not by the one before.
TEST_F(Contexts, LevelIsAskedForBeforeTheReturnIsWritten) {
    KSTContextRef created = nullptr;
    const std::pair<std::function<void()>, std::string> kFailures[] = {
        {[&] {
             answers[1].reply.pop_back();
             EXPECT_EQ(KSTContextCreate(&created), -5);
             answers[1].reply.push_back(40);
         },
         returned("KSTContextCreate", -5)},
        {[&] { EXPECT_EQ(KSTContextCreate(nullptr), -3); }, returned("KSTContextCreate", -3)},
        {[&] {
             answers[18].reply.pop_back();
             EXPECT_EQ(openContext(), nullptr);
             answers[18].reply.push_back(40);
         },
         returnedReference(nullptr)},
        {[&] {
             answers[2].status = -9;
             EXPECT_EQ(KSTContextDelete(context, true), -9);
         },
         returned("KSTContextDelete", -9)},
        {[&] {
             answers[19].status = -9;
             KSTContextGetExternalForm(context, block);
         },
         returned("KSTContextGetExternalForm", -9)},
    };
    for (const auto& [fail, lastLine] : kFailures) {
        SCOPED_TRACE(lastLine);
        channel.scalarCalls.clear();
        channel.scalars = {29};
        kst::gLogLevel = 71;
        log.clear();
        fail();
        EXPECT_EQ(channel.scalarCalls.size(), 1U);
        const Lines lines = logged();
        ASSERT_GE(lines.size(), 3U);
        EXPECT_EQ(Lines(lines.end() - 3, lines.end()),
                  (Lines{"KSTLib: updateLogLevel: log level set to 29.\n",
                         "KSTLib: updateLogLevel: returning.\n", lastLine}));
        channel.scalars = {71};
        kst::gLogLevel = 40;
        fail();
        EXPECT_NE(logged().back(), lastLine) << "written before the level was known";
    }
    EXPECT_EQ(created, nullptr);
    EXPECT_TRUE(block.calls.empty());
    kst::gLogLevel = 40;
}

TEST_F(Contexts, CreateWithEveryAllocationFailing) {
    channel.scalars = {40};
    const std::size_t allocations = failEachAllocation([] {
        KSTContextRef created = nullptr;
        const KSTStatus status = KSTContextCreate(&created);
        if (status == 0) {
            EXPECT_EQ(KSTContextDelete(created, false), 0);
            forgetTheSeventeenthByte();
        }
        return status;
    });
    EXPECT_EQ(allocations, 2U);
    EXPECT_EQ(logged().front(), failedCheck("ref"));
}

TEST_F(Contexts, ExternalFormOfAContextThatExists) {
    const std::int64_t before = gAllocatedBytes;
    KSTContextRef opened = openContext();
    ASSERT_NE(opened, nullptr);
    EXPECT_EQ(gAllocatedBytes, before + 16);
    const auto& call = channel.structCalls.front();
    EXPECT_EQ(call.input, frame(18, kHandle));
    EXPECT_EQ(call.offeredSize, 5U);
    channel.structCalls.clear();
    EXPECT_EQ(KSTContextDelete(opened, true), 0);
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(2, kHandle)});
    EXPECT_EQ(gAllocatedBytes, before);
    expectLogged({});
}

TEST_F(Contexts, ExternalFormThatTheKernelDoesNotKnow) {
    answers[18].reply = {0, 0, 0, 0, 29};
    EXPECT_EQ(openContext(), nullptr);
    EXPECT_EQ(kst::gLogLevel, 29);
    EXPECT_TRUE(channel.scalarCalls.empty());
    expectLogged({returnedReference(nullptr)});
    kst::gLogLevel = 40;
}

TEST_F(Contexts, ExternalFormTakesTheLevelOver) {
    kst::gLogLevel = 30;
    answers[18].reply = {0, 0, 0, 0x80, 30};
    KSTContextRef opened = openContext();
    ASSERT_NE(opened, nullptr);
    expectLogged({called("KSTContextCreateWithExternalForm"), returnedReference(opened)});
    kst::gLogLevel = 40;
    EXPECT_EQ(KSTContextDelete(opened, false), 0);
}

TEST_F(Contexts, ExternalFormsOfTheWrongSize) {
    channel.scalars = {40};
    EXPECT_EQ(KSTContextCreateWithExternalForm(nullptr, 16), nullptr);
    expectLogged({failedCheck("externalForm"), returnedReference(nullptr)});
    for (const std::size_t size : {std::size_t{0}, std::size_t{15}, std::size_t{17}, SIZE_MAX}) {
        EXPECT_EQ(KSTContextCreateWithExternalForm(kHandle.data(), size), nullptr);
        expectLogged({failedCheck("dataLength == sizeof(KSTHandle)"), returnedReference(nullptr)});
    }
    EXPECT_TRUE(sent().empty());
    EXPECT_EQ(channel.scalarCalls.size(), 5U);
}

TEST_F(Contexts, ExternalFormReplies) {
    channel.scalars = {40};
    for (const std::size_t size : {0U, 4U}) {
        channel.reportedSize = size;
        EXPECT_EQ(openContext(), nullptr);
        expectLogged({failedCheck("outSize == sizeof(uint32_t) + sizeof(uint8_t)"),
                      returnedReference(nullptr)});
    }
    channel.reportedSize = 6;
    EXPECT_EQ(openContext(), nullptr);
    expectLogged({failedCheck("replySize <= offeredSize"),
                  failedCheck("err == 0 ", "0xfffffffffffffffb"), returnedReference(nullptr)});
    channel.reportedSize.reset();
    answers[18].status = -9;
    EXPECT_EQ(openContext(), nullptr);
    expectLogged({failedWith9(), failedWith9(), returnedReference(nullptr)});
    EXPECT_EQ(channel.scalarCalls.size(), 4U);
}

TEST_F(Contexts, ExternalFormWithEveryAllocationFailing) {
    channel.scalars = {40};
    answers[18].reply.back() = 35;
    const char* const kChecks[] = {"outBuffer", "cmd", "ref"};
    for (std::size_t i = 0; i < 3; ++i) {
        const ScriptedGate gate(i);
        EXPECT_EQ(openContext(), nullptr);
        EXPECT_EQ(logged().front(), failedCheck(kChecks[i]));
        EXPECT_EQ(kst::gLogLevel, 40);
        log.clear();
    }
    EXPECT_EQ(channel.scalarCalls.size(), 3U);
}

TEST_F(Contexts, DeleteWithoutDestroyingSendsNothing) {
    EXPECT_EQ(KSTContextDelete(context, false), 0);
    context = nullptr;
    EXPECT_TRUE(sent().empty());
}

TEST_F(Contexts, DeleteThatFailsKeepsTheContext) {
    channel.scalars = {40};
    answers[2].status = -9;
    EXPECT_EQ(KSTContextDelete(context, true), -9);
    expectLogged({failedWith9(), failedWith9(), returned("KSTContextDelete", -9)});
    EXPECT_EQ(channel.scalarCalls.size(), 1U);
    EXPECT_EQ(KSTContextDelete(nullptr, true), -3);
    expectLogged({failedCheck("context"), returned("KSTContextDelete", -3)});
    answers[2].status = 0;
    channel.structCalls.clear();
    EXPECT_EQ(KSTContextDelete(context, true), 0);
    context = nullptr;
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(2, kHandle)});
}

TEST_F(Contexts, GetExternalForm) {
    KSTContextGetExternalForm(context, block);
    EXPECT_EQ(channel.structCalls.front().offeredSize.value_or(0), 0U);
    EXPECT_EQ(sent(), std::vector<Bytes>{frame(19, kHandle)});
    ASSERT_EQ(block.calls.size(), 1U);
    EXPECT_EQ(block.calls.front().bytes, kHandle);
    expectLogged({});
    kst::gLogLevel = 30;
    KSTContextGetExternalForm(context, block);
    expectLogged({called("KSTContextGetExternalForm"), returned("KSTContextGetExternalForm", 0)});
    kst::gLogLevel = 40;
}

TEST_F(Contexts, GetExternalFormThatFails) {
    constexpr const char* kFunction = "KSTContextGetExternalForm";
    channel.scalars = {40};
    KSTContextGetExternalForm(nullptr, nullptr);
    expectLogged({failedCheck("context"), returned(kFunction, -3)});
    KSTContextGetExternalForm(context, nullptr);
    expectLogged({failedCheck("processExternalForm"), returned(kFunction, -3)});
    EXPECT_TRUE(sent().empty());
    answers[19].status = -9;
    KSTContextGetExternalForm(context, block);
    expectLogged({failedWith9(), failedWith9(), returned(kFunction, -9)});
    const ScriptedGate gate(0);
    KSTContextGetExternalForm(context, block);
    expectLogged({failedCheck("cmd"), failedCheck("err == 0 ", "0xfffffffffffffffc"),
                  returned(kFunction, -4)});
    EXPECT_TRUE(block.calls.empty());
    EXPECT_EQ(channel.scalarCalls.size(), 4U);
}
