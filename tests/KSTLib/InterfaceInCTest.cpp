#include "tests/KSTLib/InterfaceInC.h"

#include "KSTLib/KSTLib.h"
#include "tests/KSTLib/ContextFixture.h"
#include "tests/common/CredentialSamples.h"
#include "tests/common/RequirementSamples.h"

#include <gtest/gtest.h>

#include <set>
#include <string>

namespace {

using support::Bytes;

using InterfaceInC = support::ChannelFixture;

Bytes bytesOf(const Seen& seen) {
    return {seen.bytes, seen.bytes + seen.length};
}

} // namespace

TEST_F(InterfaceInC, BlockHasTheSameSize) {
    EXPECT_EQ(sizeOfDataBlockInC(), sizeof(KSTDataBlock));
    EXPECT_EQ(sizeOfDataBlockInC(), 2 * sizeof(void*));
    EXPECT_EQ(sizeOfPropertyBlockInC(), sizeof(KSTPropertyBlock));
    EXPECT_EQ(sizeOfCredentialInC(), 32U + 88U);
}

TEST_F(InterfaceInC, Credential) {
    Seen seen{};
    EXPECT_EQ(passphraseFromC("secret", 6, &seen), 0);
    EXPECT_EQ(bytesOf(seen), (Bytes{'s', 'e', 'c', 'r', 'e', 't'}));
    EXPECT_EQ(passphraseFromC("secret", 129, &seen), kKSTErrorBadParameter);
}

TEST_F(InterfaceInC, CredentialList) {
    Bytes bytes = {2, 0, 0, 0};
    support::append(bytes, support::credentialBytes(4));
    support::append(bytes, support::credentialBytes(12));
    Bytes written(bytes.size());
    EXPECT_EQ(credentialListFromC(bytes.data(), bytes.size(), written.data(), written.size()),
              bytes.size());
    EXPECT_EQ(written, bytes);
}

TEST_F(InterfaceInC, Requirement) {
    const Bytes bytes = support::compositeBytes(
        7, {support::leafBytes(2), support::leafBytes(16), support::leafBytes(3)});
    Seen properties{};
    Seen children{};
    EXPECT_EQ(walkRequirementFromC(bytes.data(), bytes.size(), &properties, &children), 0);
    EXPECT_EQ(properties.calls, 4);
    EXPECT_EQ(properties.sum, 1U + 2U + 3U + 700U);
    EXPECT_EQ(bytesOf(properties), (Bytes{0x10, 0x10, 0x10, 0x10}));
    EXPECT_EQ(children.calls, 3);
    EXPECT_EQ(children.sum, 21U);
}

TEST_F(InterfaceInC, KernelControl) {
    channel.reply = {5, 6, 7};
    Seen seen{};
    EXPECT_EQ(kernelControlFromC(7, "ab", 2, &seen), 0);
    EXPECT_EQ(channel.structCalls.back().input,
              (Bytes{'D', 'R', 'C', 'S', 26, 0, 0, 0, 7, 0, 0, 0, 'a', 'b'}));
    EXPECT_EQ(seen.calls, 1);
    EXPECT_EQ(bytesOf(seen), (Bytes{5, 6, 7}));
}

TEST_F(InterfaceInC, KernelControlWithoutBlock) {
    channel.reply = {5, 6, 7};
    EXPECT_EQ(kernelControlWithoutBlockFromC(7), 0);
    channel.structStatus = -9;
    EXPECT_EQ(kernelControlWithoutBlockFromC(7), -9);
}

TEST_F(InterfaceInC, EmptyReply) {
    Seen seen{};
    EXPECT_EQ(kernelControlFromC(7, nullptr, 0, &seen), 0);
    EXPECT_EQ(seen.calls, 1);
    EXPECT_EQ(seen.wasNull, 1);
    EXPECT_EQ(seen.length, 0U);
}

TEST_F(InterfaceInC, EnvironmentVariables) {
    EXPECT_EQ(setVariableFromC(3, "v", 1), 0);
    EXPECT_EQ(channel.structCalls.back().input,
              (Bytes{'D', 'R', 'C', 'S', 24, 0, 0, 0, 3, 0, 0, 0, 'v'}));
    EXPECT_EQ(setVariableFromC(3, "v", 65), kKSTErrorBadParameter);
    channel.reply = {'v'};
    Seen seen{};
    EXPECT_EQ(getVariableFromC(3, &seen), 0);
    EXPECT_EQ(bytesOf(seen), Bytes{'v'});
    EXPECT_EQ(getVariableWithoutBlockFromC(3), kKSTErrorBadParameter);
}

TEST_F(InterfaceInC, TransportAndBlockInC) {
    TransportInC transport{};
    transport.reply = "xyz";
    transport.replySize = 3;
    EXPECT_EQ(libCallSetFromC(&transport, "v", 1), 0);
    EXPECT_EQ(transport.code, 24U);
    EXPECT_EQ(bytesOf(transport.seen), (Bytes{1, 0, 0, 0, 'v'}));

    Seen seen{};
    EXPECT_EQ(libCallGetFromC(&transport, &seen), 0);
    EXPECT_EQ(transport.code, 25U);
    EXPECT_EQ(bytesOf(seen), (Bytes{'x', 'y', 'z'}));
    EXPECT_EQ(libCallControlFromC(&transport, &seen), 0);
    EXPECT_EQ(transport.code, 26U);
    EXPECT_EQ(seen.calls, 2);

    transport.status = -1110;
    EXPECT_EQ(libCallSetFromC(&transport, "v", 1), -1110);
    EXPECT_EQ(libCallGetFromC(&transport, &seen), -1110);
    EXPECT_EQ(seen.calls, 2);
    EXPECT_EQ(libCallControlFromC(&transport, &seen), -1110);
    EXPECT_EQ(seen.calls, 3);
}

TEST_F(InterfaceInC, FrameIsGivenBackAsItsHeaderSays) {
    const std::int64_t before = allocatedBytesInC();
    Bytes frame(11);
    EXPECT_EQ(buildCommandFromC(1, "abc", 3, frame.data()), 11U);
    EXPECT_EQ(frame, (Bytes{'D', 'R', 'C', 'S', 1, 0, 0, 0, 'a', 'b', 'c'}));
    EXPECT_EQ(allocatedBytesInC(), before);
}

namespace {

using ContextInC = support::ContextFixture;

const Bytes kUnmet = {0, 0, 0, 0, 3, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0};

} // namespace

TEST_F(ContextInC, SizesAreTheSame) {
    EXPECT_EQ(sizeOfParameterInC(), sizeof(KSTParameter));
    EXPECT_EQ(sizeOfParameterInC(), 24U);
    EXPECT_EQ(sizeOfPolicyBlocksInC(), 6 * sizeof(void*));
}

TEST_F(ContextInC, Story) {
    answers[3].reply = kUnmet;
    answers[11].reply = {1, 0, 0, 0};
    Seen form{};
    SeenPolicy policy{};
    EXPECT_EQ(contextFromC(kHandle.data(), &form, &policy), 0);
    EXPECT_EQ(bytesOf(form), kHandle);
    EXPECT_EQ(policy.calls, 4);
    EXPECT_EQ(policy.status, 0);
    EXPECT_EQ(policy.satisfied, 1);
    EXPECT_EQ(policy.requirementType, 0U);
    std::vector<int> codes;
    for (const Bytes& frame : sent()) {
        codes.push_back(frame[4]);
    }
    EXPECT_EQ(codes, (std::vector<int>{18, 19, 5, 3, 3, 3, 11}));
}

TEST_F(ContextInC, GlobalPolicy) {
    answers[3].reply = kUnmet;
    SeenPolicy policy{};
    globalPolicyFromC(&policy);
    EXPECT_EQ(policy.calls, 1);
    EXPECT_EQ(policy.satisfied, 0);
    EXPECT_EQ(policy.requirementType, 3U);
    // The account keeps one byte of every context from KSTContextCreate.
    gAllocatedBytes -= 1;
}

TEST_F(ContextInC, ParseAcl) {
    answers[20].reply = {7, 8, 9};
    Seen seen{};
    std::int32_t status = 4711;
    EXPECT_EQ(parseAclFromC("acl", 3, &seen, &status), 0);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(bytesOf(seen), (Bytes{7, 8, 9}));
    EXPECT_EQ(parseAclFromC("", 0, &seen, &status), -3);
    EXPECT_EQ(status, -3);
    EXPECT_EQ(seen.wasNull, 1);
    EXPECT_EQ(seen.length, 4096U);
}

TEST(InterfaceNames, EveryFunctionIsThereOnce) {
    std::set<std::string> names;
    for (std::size_t i = 0; i < kPublicFunctionCount; ++i) {
        EXPECT_NE(kPublicFunctions[i].function, nullptr);
        names.insert(kPublicFunctions[i].name);
    }
    EXPECT_EQ(names.size(), kPublicFunctionCount);
    EXPECT_TRUE(names.contains("KSTContextCreate"));
}

TEST(InterfaceNames, VersionIsTheLibrarys) {
    EXPECT_EQ(std::to_string(KST_VERSION_MAJOR) + "." + std::to_string(KST_VERSION_MINOR) + "." +
                  std::to_string(KST_VERSION_PATCH),
              KSTLIB_VERSION);
}
