#include "KSTLib/RequestSerialization.h"
#include "tests/common/ParameterPayloads.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

#include <cstdlib>

namespace {

using support::Bytes;
using support::ExactBuffer;
using support::putU32;
using support::ScriptedGate;

/// Without a handle: constraint 1 to 10, preflight 9, age 6.
const Bytes kConstraintPayload = {0, 0, 0, 0, 0, 0, 0, 0, 0, 0,  0, 0, 0, 0, 0, 0, 10, 0, 0, 0,
                                  1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 9, 6, 0, 0, 0, 0, 0,  0, 0};

/// Handle 1 to 16, list "abcde", no operation, age 6.
const Bytes kAclPayload = {1, 2,   3,   4,   5,   6,   7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 5, 0, 0,
                           0, 'a', 'b', 'c', 'd', 'e', 0, 0, 0, 0,  6,  0,  0,  0,  0,  0,  0, 0};

/// Lengths that a payload of some 40 bytes announces. A sanitizer keeps shadow memory for what is
/// only announced, which takes it seconds.
#ifdef KSTD_SANITIZED
constexpr bool kIsSanitized = true;
#else
constexpr bool kIsSanitized = false;
#endif
const std::vector<std::uint32_t> kAnnounced =
    kIsSanitized ? std::vector<std::uint32_t>{20, 1000, 0x100000}
                 : std::vector<std::uint32_t>{20, 1000, 0x100000, 0x80000000U, 0xffffffffU};

/// -3 where the machine gives that much address space, otherwise -4.
KSTStatus statusOfAllocating(std::uint32_t size) {
    void* memory = std::calloc(1, size);
    std::free(memory);
    return memory != nullptr ? kKSTErrorBadParameter : kKSTErrorOutOfMemory;
}

class VerifyAcl : public support::SerializationFixture {
  protected:
    struct Result {
        KSTHandle handle{};
        void* constraint = nullptr;
        std::uint32_t length = 4711;
        std::uint8_t preflight = 0xee;
        std::uint32_t age = 0;
        KSTParameter* parameters = nullptr;
        std::uint32_t count = 0;
    };

    static KSTStatus read(const Bytes& bytes, Result& result) {
        const ExactBuffer buffer(bytes);
        return DeserializeVerifyAclConstraint(
            buffer.data(), static_cast<std::uint32_t>(buffer.size()), &result.handle,
            &result.constraint, &result.length, &result.preflight, &result.age, &result.parameters,
            &result.count);
    }

    static KSTStatus write(const KSTHandle* handle, const void* constraint, std::uint32_t length,
                           void* buffer, std::uint32_t* size) {
        return SerializeVerifyAclConstraint(handle, constraint, length, 9, 6, nullptr, 0, buffer,
                                            size);
    }

    const Bytes constraint = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10};
};

class ProcessAcl : public support::SerializationFixture {
  protected:
    struct Result {
        KSTHandle handle{};
        void* acl = nullptr;
        std::uint32_t aclLength = 4711;
        void* operation = nullptr;
        std::uint32_t operationLength = 4711;
        std::uint32_t age = 0;
        KSTParameter* parameters = nullptr;
        std::uint32_t count = 0;
    };

    static KSTStatus read(const Bytes& bytes, Result& result) {
        const ExactBuffer buffer(bytes);
        return DeserializeProcessAcl(buffer.data(), static_cast<std::uint32_t>(buffer.size()),
                                     &result.handle, &result.acl, &result.aclLength,
                                     &result.operation, &result.operationLength, &result.age,
                                     &result.parameters, &result.count);
    }

    const KSTHandle handle = support::countingHandle();
};

} // namespace

TEST_F(VerifyAcl, AnnouncesFourBytesMoreThanItWrites) {
    std::uint32_t size = 0;
    ASSERT_EQ(GetSerializedVerifyAclConstraintSize(nullptr, constraint.data(), 10, 9, 6, nullptr, 0,
                                                   &size),
              0);
    EXPECT_EQ(size, 43U);
    const ExactBuffer buffer(size);
    ASSERT_EQ(write(nullptr, constraint.data(), 10, buffer.data(), &size), 0);
    EXPECT_EQ(size, 39U);
    EXPECT_EQ(Bytes(buffer.data(), buffer.data() + 39), kConstraintPayload);
    expectLogged({});
    for (const std::uint32_t room : {39U, 42U}) {
        size = room;
        EXPECT_EQ(write(nullptr, constraint.data(), 10, buffer.data(), &size), -3);
        EXPECT_EQ(size, room);
        expectLogged({failedCheck("*outSize >= requiredSize")});
    }
}

TEST_F(VerifyAcl, ReadsWhatIsThere) {
    Result result;
    ASSERT_EQ(read(kConstraintPayload, result), 0);
    EXPECT_EQ(Bytes(result.handle.bytes, result.handle.bytes + 16), Bytes(16));
    EXPECT_EQ(result.preflight, 1);
    EXPECT_EQ(result.age, 6U);
    EXPECT_EQ(result.parameters, nullptr);
    EXPECT_EQ(result.count, 0U);
    EXPECT_EQ(support::takeBlob(result.constraint, result.length), constraint);
}

TEST_F(VerifyAcl, PreflightIsReadAsAFlag) {
    for (const int preflight : {0, 1, 7, 0x80, 0xff}) {
        Bytes bytes = kConstraintPayload;
        bytes[30] = static_cast<std::uint8_t>(preflight);
        Result result;
        ASSERT_EQ(read(bytes, result), 0);
        EXPECT_EQ(result.preflight, preflight != 0 ? 1 : 0);
        DeallocDataBlob(result.constraint, result.length);
    }
}

TEST_F(VerifyAcl, EmptyConstraintIsWrittenAndReadAsNull) {
    const ExactBuffer buffer(33);
    std::uint32_t size = 33;
    ASSERT_EQ(write(nullptr, constraint.data(), 0, buffer.data(), &size), 0);
    EXPECT_EQ(size, 29U);
    Result result;
    const ScriptedGate gate;
    ASSERT_EQ(read({buffer.data(), buffer.data() + 29}, result), 0);
    EXPECT_EQ(result.constraint, nullptr);
    EXPECT_EQ(result.length, 0U);
    EXPECT_TRUE(gate.asked.empty());
    expectLogged({});
}

TEST_F(VerifyAcl, LengthsThatAreNotThere) {
    for (const std::uint32_t length : kAnnounced) {
        Bytes bytes = kConstraintPayload;
        putU32(bytes, 16, length);
        Result result;
        const KSTStatus expected = statusOfAllocating(length);
        const ScriptedGate gate;
        EXPECT_EQ(read(bytes, result), expected);
        EXPECT_EQ(gate.asked, std::vector<std::size_t>{length});
        // Nothing was written, so nothing is wiped.
        EXPECT_EQ(gate.freed,
                  std::vector<std::size_t>(expected == kKSTErrorBadParameter ? 1 : 0, 0));
        expectLogged(
            {failedCheck(expected == kKSTErrorBadParameter ? "(size - offset) >= constraintLength"
                                                           : "constraint")});
    }
}

TEST_F(VerifyAcl, SizesOfThirtyTwoBits) {
    std::uint32_t size = 0;
    EXPECT_EQ(GetSerializedVerifyAclConstraintSize(nullptr, constraint.data(), 0xffffffff, 0, 0,
                                                   nullptr, 0, &size),
              0);
    EXPECT_EQ(size, 32U);
    const ExactBuffer buffer(32);
    EXPECT_EQ(write(nullptr, constraint.data(), 0xffffffff, buffer.data(), &size), -3);
    EXPECT_EQ(buffer.bytes(), Bytes(32, 0xa5));
    expectLogged({failedCheck("*outSize >= requiredSize")});
    size = 0xffffffff;
    EXPECT_EQ(write(nullptr, constraint.data(), 0xffffffff - 32, buffer.data(), &size), -3);
    EXPECT_EQ(buffer.bytes(), Bytes(32, 0xa5));
    expectLogged({failedCheck("*outSize >= requiredSize")});
}

TEST_F(VerifyAcl, MissingArgumentsOfTheWriters) {
    std::uint32_t size = 100;
    std::uint8_t buffer[100];
    const KSTParameter parameter{};
    const char* const kPair =
        "(parameters && parametersCount) || (!parameters && !parametersCount)";
    const auto announce = [](const void* blob, std::uint32_t count, std::uint32_t* out) {
        return GetSerializedVerifyAclConstraintSize(nullptr, blob, 1, 0, 0, nullptr, count, out);
    };
    EXPECT_EQ(announce(nullptr, 1, nullptr), -3);
    EXPECT_EQ(announce("a", 1, nullptr), -3);
    EXPECT_EQ(announce("a", 1, &size), -3);
    EXPECT_EQ(GetSerializedVerifyAclConstraintSize(nullptr, "a", 1, 0, 0, &parameter, 11, &size),
              -3);
    expectLogged({failedCheck("aclConstraint"), failedCheck("outSize"), failedCheck(kPair),
                  failedCheck("parametersCount <= 10")});
    const auto writeWith = [&](const void* blob, std::uint32_t count, void* out,
                               std::uint32_t* outSize) {
        return SerializeVerifyAclConstraint(nullptr, blob, 1, 0, 0, nullptr, count, out, outSize);
    };
    EXPECT_EQ(writeWith(nullptr, 1, nullptr, nullptr), -3);
    EXPECT_EQ(writeWith("a", 1, nullptr, nullptr), -3);
    EXPECT_EQ(writeWith("a", 0, nullptr, nullptr), -3);
    EXPECT_EQ(writeWith("a", 0, buffer, nullptr), -3);
    expectLogged({failedCheck("aclConstraint"), failedCheck(kPair), failedCheck("outBuffer"),
                  failedCheck("outSize")});
}

TEST_F(VerifyAcl, MissingArgumentsOfTheReader) {
    Result r;
    const auto readWith = [&](int missing) {
        const auto given = [&](int number, auto* pointer) {
            return number == missing ? nullptr : pointer;
        };
        return DeserializeVerifyAclConstraint(
            given(0, kConstraintPayload.data()), 39, given(1, &r.handle), given(2, &r.constraint),
            given(3, &r.length), given(4, &r.preflight), given(5, &r.age), given(6, &r.parameters),
            given(7, &r.count));
    };
    int missing = 0;
    for (const char* name :
         {"buffer", "handle", "aclConstraint", "aclConstraintLength", "preflight",
          "maxGlobalCredentialAge", "parameters", "parametersCount"}) {
        EXPECT_EQ(readWith(missing++), -3);
        expectLogged({failedCheck(name)});
    }
}

TEST_F(VerifyAcl, FailedAllocationComesBeforeTheMissingBytes) {
    Bytes bytes = kConstraintPayload;
    putU32(bytes, 16, 1000);
    const ScriptedGate gate(0);
    Result result;
    EXPECT_EQ(read(bytes, result), -4);
    EXPECT_EQ(result.constraint, nullptr);
    expectLogged({failedCheck("constraint")});
}

TEST_F(ProcessAcl, AnnouncesFourBytesMoreThanItWrites) {
    std::uint32_t size = 0;
    ASSERT_EQ(GetSerializedProcessAclSize(&handle, "abcde", 5, nullptr, 0, 6, nullptr, 0, &size),
              0);
    EXPECT_EQ(size, 41U);
    const ExactBuffer buffer(size);
    ASSERT_EQ(
        SerializeProcessAcl(&handle, "abcde", 5, nullptr, 0, 6, nullptr, 0, buffer.data(), &size),
        0);
    EXPECT_EQ(size, 37U);
    EXPECT_EQ(Bytes(buffer.data(), buffer.data() + 37), kAclPayload);
    expectLogged({});
    size = 40;
    EXPECT_EQ(
        SerializeProcessAcl(&handle, "abcde", 5, nullptr, 0, 6, nullptr, 0, buffer.data(), &size),
        -3);
    expectLogged({failedCheck("*outSize >= requiredSize")});
}

TEST_F(ProcessAcl, EmptyOperationIsNull) {
    Result result;
    const ScriptedGate gate;
    ASSERT_EQ(read(kAclPayload, result), 0);
    EXPECT_EQ(gate.asked.size(), 1U);
    EXPECT_EQ(result.operation, nullptr);
    EXPECT_EQ(result.operationLength, 0U);
    EXPECT_EQ(result.age, 6U);
    EXPECT_EQ(Bytes(result.handle.bytes, result.handle.bytes + 16),
              Bytes(kAclPayload.begin(), kAclPayload.begin() + 16));
    EXPECT_EQ(support::takeBlob(result.acl, result.aclLength), (Bytes{'a', 'b', 'c', 'd', 'e'}));
}

TEST_F(ProcessAcl, WithoutAHandle) {
    Bytes golden = kAclPayload;
    std::fill_n(golden.begin(), 16, std::uint8_t{0});
    const ExactBuffer buffer(41);
    std::uint32_t size = 41;
    ASSERT_EQ(
        SerializeProcessAcl(nullptr, "abcde", 5, "ignored", 0, 6, nullptr, 0, buffer.data(), &size),
        0);
    EXPECT_EQ(Bytes(buffer.data(), buffer.data() + 37), golden);
}

TEST_F(ProcessAcl, EmptyListIsReadButNotWritten) {
    Bytes bytes(32);
    Result result;
    ASSERT_EQ(read(bytes, result), 0);
    EXPECT_EQ(result.acl, nullptr);
    EXPECT_EQ(result.aclLength, 0U);
    expectLogged({});
    std::uint32_t size = 100;
    EXPECT_EQ(GetSerializedProcessAclSize(&handle, "a", 0, nullptr, 0, 0, nullptr, 0, &size), -3);
    EXPECT_EQ(GetSerializedProcessAclSize(&handle, nullptr, 1, nullptr, 0, 0, nullptr, 0, &size),
              -3);
    EXPECT_EQ(SerializeProcessAcl(&handle, "a", 0, nullptr, 0, 0, nullptr, 0, bytes.data(), &size),
              -3);
    EXPECT_EQ(
        SerializeProcessAcl(&handle, nullptr, 1, nullptr, 0, 0, nullptr, 0, bytes.data(), &size),
        -3);
    expectLogged(support::Lines(4, failedCheck("acl && aclLength")));
}

TEST_F(ProcessAcl, OperationWithoutAPointer) {
    const ExactBuffer buffer(42);
    std::uint32_t size = 42;
    EXPECT_EQ(
        SerializeProcessAcl(&handle, "abcde", 5, nullptr, 1, 6, nullptr, 0, buffer.data(), &size),
        -3);
    EXPECT_EQ(buffer.bytes(), Bytes(42, 0xa5));
    expectLogged({failedCheck("operation || !operationLength")});
}

TEST_F(ProcessAcl, LengthsThatAreNotThere) {
    for (const std::uint32_t length : kAnnounced) {
        const KSTStatus expected = statusOfAllocating(length);
        const bool hasMemory = expected == kKSTErrorBadParameter;
        Result result;
        Bytes bytes = kAclPayload;
        putU32(bytes, 25, length);
        EXPECT_EQ(read(bytes, result), expected);
        expectLogged({failedCheck(hasMemory ? "(size - offset) >= opLen" : "op")});
        bytes = kAclPayload;
        putU32(bytes, 16, length);
        EXPECT_EQ(read(bytes, result), expected);
        expectLogged({failedCheck(hasMemory ? "(size - offset) >= tmpAclLength" : "tmpAcl")});
    }
}

TEST_F(ProcessAcl, SizesOfThirtyTwoBits) {
    std::uint32_t size = 0;
    EXPECT_EQ(GetSerializedProcessAclSize(nullptr, "a", 0xffffffff, nullptr, 0xffffffff, 0, nullptr,
                                          0, &size),
              0);
    EXPECT_EQ(size, 34U);
    const ExactBuffer buffer(34);
    for (const std::uint32_t room : {34U, 0xffffffffU}) {
        size = room;
        EXPECT_EQ(SerializeProcessAcl(nullptr, "a", 0xffffffff, "b", 0xffffffff, 0, nullptr, 0,
                                      buffer.data(), &size),
                  -3);
        expectLogged({failedCheck("*outSize >= requiredSize")});
    }
    EXPECT_EQ(buffer.bytes(), Bytes(34, 0xa5));
}

TEST_F(ProcessAcl, MissingArgumentsOfTheWriters) {
    std::uint32_t size = 100;
    std::uint8_t buffer[100];
    const KSTParameter parameter{};
    const char* const kPair =
        "(parameters && parametersCount) || (!parameters && !parametersCount)";
    const auto announce = [](const KSTParameter* parameters, std::uint32_t count,
                             std::uint32_t* out) {
        return GetSerializedProcessAclSize(nullptr, "a", 1, nullptr, 0, 0, parameters, count, out);
    };
    EXPECT_EQ(announce(nullptr, 1, nullptr), -3);
    EXPECT_EQ(announce(nullptr, 1, &size), -3);
    EXPECT_EQ(announce(&parameter, 0, &size), -3);
    EXPECT_EQ(announce(&parameter, 11, &size), -3);
    expectLogged({failedCheck("outSize"), failedCheck(kPair), failedCheck(kPair),
                  failedCheck("parametersCount <= 10")});
    const auto writeWith = [](std::uint32_t count, void* out, std::uint32_t* outSize) {
        return SerializeProcessAcl(nullptr, "a", 1, nullptr, 0, 0, nullptr, count, out, outSize);
    };
    EXPECT_EQ(writeWith(1, nullptr, nullptr), -3);
    EXPECT_EQ(writeWith(0, nullptr, nullptr), -3);
    EXPECT_EQ(writeWith(0, buffer, nullptr), -3);
    expectLogged({failedCheck(kPair), failedCheck("outBuffer"), failedCheck("outSize")});
}

TEST_F(ProcessAcl, MissingArgumentsOfTheReader) {
    Result r;
    const auto readWith = [&](int missing) {
        const auto given = [&](int number, auto* pointer) {
            return number == missing ? nullptr : pointer;
        };
        return DeserializeProcessAcl(given(0, kAclPayload.data()), 37, given(1, &r.handle),
                                     given(2, &r.acl), given(3, &r.aclLength),
                                     given(4, &r.operation), given(5, &r.operationLength),
                                     given(6, &r.age), given(7, &r.parameters), given(8, &r.count));
    };
    int missing = 0;
    for (const char* name : {"buffer", "handle", "acl", "aclLength", "operation", "operationLength",
                             "maxGlobalCredentialAge", "parameters", "parametersCount"}) {
        EXPECT_EQ(readWith(missing++), -3);
        expectLogged({failedCheck(name)});
    }
}

TEST_F(ProcessAcl, FailedAllocationComesBeforeTheMissingBytes) {
    const char* const kChecks[] = {"tmpAcl", "op"};
    for (std::size_t i = 0; i < 2; ++i) {
        Bytes bytes = kAclPayload;
        putU32(bytes, i == 0 ? 16 : 25, 1000);
        const ScriptedGate gate(i);
        Result result;
        EXPECT_EQ(read(bytes, result), -4);
        EXPECT_EQ(result.acl, nullptr);
        // The list that was copied by then is wiped whole.
        EXPECT_EQ(gate.freed, i == 0 ? std::vector<std::size_t>() : std::vector<std::size_t>{5});
        EXPECT_TRUE(gate.everyFreeWasWiped);
        expectLogged({failedCheck(kChecks[i])});
    }
}
