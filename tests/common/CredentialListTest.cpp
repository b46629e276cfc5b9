#include "KSTLib/CredentialSerialization.h"
#include "tests/common/CredentialSamples.h"
#include "tests/support/ScriptedGate.h"

#include <gtest/gtest.h>

namespace {

using support::Bytes;
using support::credentialBytes;
using support::ExactBuffer;
using support::Lines;
using support::ScriptedGate;

Bytes listBytes(std::uint32_t count, const std::vector<std::uint32_t>& types) {
    Bytes bytes(4);
    support::putU32(bytes, 0, count);
    for (const std::uint32_t type : types) {
        support::append(bytes, credentialBytes(type));
    }
    return bytes;
}

Bytes listBytes(const std::vector<std::uint32_t>& types) {
    return listBytes(static_cast<std::uint32_t>(types.size()), types);
}

/// Credentials in memory and the array of pointers to them.
struct MemoryList {
    explicit MemoryList(const std::vector<std::uint32_t>& types) {
        for (const std::uint32_t type : types) {
            records.push_back(credentialBytes(type));
        }
        for (Bytes& record : records) {
            pointers.push_back(support::asCredential(record));
        }
    }

    [[nodiscard]] std::uint32_t count() const {
        return static_cast<std::uint32_t>(pointers.size());
    }

    std::vector<Bytes> records;
    std::vector<KSTCredential*> pointers;
};

class CredentialList : public support::SerializationFixture {
  protected:
    KSTStatus read(const Bytes& bytes) {
        const ExactBuffer buffer(bytes);
        return DeserializeCredentialList(buffer.data(), buffer.size(), &list, &count);
    }

    void expectRefused(const Bytes& bytes, const Lines& lines) {
        const std::int64_t before = gAllocatedBytes;
        EXPECT_EQ(read(bytes), -3);
        EXPECT_EQ(gAllocatedBytes, before);
        EXPECT_EQ(list, kUntouchedList);
        EXPECT_EQ(count, 4711U);
        expectLogged(lines);
    }

    Bytes written() const {
        std::size_t size = 100000;
        const ExactBuffer target(size);
        EXPECT_EQ(SerializeCredentialList(list, count, target.data(), &size), 0);
        return {target.data(), target.data() + size};
    }

    KSTCredential* untouched = nullptr;
    KSTCredential** const kUntouchedList = &untouched;
    KSTCredential** list = kUntouchedList;
    std::uint32_t count = 4711;
};

} // namespace

TEST_F(CredentialList, EmptyList) {
    const Bytes empty = {0, 0, 0, 0};
    for (const std::size_t trailing : {0U, 1U, 50U}) {
        Bytes bytes = empty;
        bytes.resize(4 + trailing, 0xee);
        const ScriptedGate gate;
        list = kUntouchedList;
        EXPECT_EQ(read(bytes), 0);
        EXPECT_EQ(list, nullptr);
        EXPECT_EQ(count, 0U);
        EXPECT_TRUE(gate.asked.empty());
    }
    EXPECT_EQ(written(), empty);
    expectLogged({});
}

TEST_F(CredentialList, ThereAndBack) {
    const std::vector<std::uint32_t> types = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 2};
    const Bytes bytes = listBytes(types);
    for (const std::size_t trailing : {0U, 1U}) {
        Bytes input = bytes;
        input.resize(bytes.size() + trailing, 0xee);
        const std::int64_t before = gAllocatedBytes;
        ASSERT_EQ(read(input), 0);
        EXPECT_EQ(count, types.size());
        EXPECT_EQ(gAllocatedBytes,
                  before + static_cast<std::int64_t>(bytes.size() - 4 + types.size() * 8));
        EXPECT_EQ(list[12]->type, 2U);
        EXPECT_EQ(written(), bytes);
        DeallocCredentialList(list, count);
        EXPECT_EQ(gAllocatedBytes, before);
    }
    expectLogged({});
}

TEST_F(CredentialList, OneElement) {
    const Bytes bytes = listBytes({2});
    ASSERT_EQ(read(bytes), 0);
    ASSERT_EQ(count, 1U);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(list[0]->type, 2U);
    EXPECT_EQ(written(), bytes);
    DeallocCredentialList(list, count);
}

TEST_F(CredentialList, EveryTruncation) {
    const Bytes bytes = listBytes({4, 12, 4});
    for (std::size_t size = 0; size < bytes.size(); ++size) {
        SCOPED_TRACE(size);
        Lines lines = {failedCheck("size >= sizeof(uint32_t)")};
        if (size >= 4) {
            const bool inData = size >= 4 + 32 + 32 && size < 4 + 32 + 40;
            lines = {failedCheck(inData ? "size >= credSize" : "size >= sizeof(KSTCredential)"),
                     failedCall()};
        }
        expectRefused({bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(size)}, lines);
    }
}

TEST_F(CredentialList, CountsAtTheLimit) {
    const std::vector<std::uint32_t> types(1000, 4);
    ASSERT_EQ(read(listBytes(types)), 0);
    EXPECT_EQ(count, 1000U);
    DeallocCredentialList(list, count);
    list = kUntouchedList;
    count = 4711;
    for (const std::uint32_t tooMany : {1001U, 0x80000000U, 0xffffffffU}) {
        const ScriptedGate gate;
        expectRefused(listBytes(tooMany, types), {failedCheck("credCount <= 1000")});
        EXPECT_TRUE(gate.asked.empty());
    }
    // More than there are.
    expectRefused(listBytes(2, {4}), {failedCheck("size >= sizeof(KSTCredential)"), failedCall()});
    expectRefused({232, 3, 0, 0}, {failedCheck("size >= sizeof(KSTCredential)"), failedCall()});
    expectRefused({233, 3, 0, 0}, {failedCheck("credCount <= 1000")});
}

TEST_F(CredentialList, MalformedThirdElement) {
    Bytes bytes = listBytes({2, 12, 4, 2});
    support::putU32(bytes, 4 + 168 + 40, 13);
    const ScriptedGate gate;
    expectRefused(bytes, {failedCheck("0"), failedCall()});
    EXPECT_EQ(gate.asked, (std::vector<std::size_t>{32, 168, 40}));
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{168, 40, 32}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
}

TEST_F(CredentialList, EveryAllocationFailed) {
    const Bytes bytes = listBytes({2, 12, 4});
    for (std::size_t refused = 0; refused < 4; ++refused) {
        SCOPED_TRACE(refused);
        const ScriptedGate gate(refused);
        const std::int64_t before = gAllocatedBytes;
        EXPECT_EQ(read(bytes), -4);
        EXPECT_EQ(gate.asked.size(), refused + 1);
        EXPECT_EQ(gAllocatedBytes, before);
        EXPECT_EQ(list, kUntouchedList);
        EXPECT_EQ(count, 4711U);
        expectLogged(refused == 0 ? Lines{failedCheck("list")}
                                  : Lines{failedCheck("cred"), failedCall(-4)});
    }
    ASSERT_EQ(read(bytes), 0);
    DeallocCredentialList(list, count);
}

TEST_F(CredentialList, WritesMoreThanIsRead) {
    Bytes record = credentialBytes(4);
    const std::vector<KSTCredential*> pointers(1001, support::asCredential(record));
    std::size_t size = 4 + 1001 * 32;
    const ExactBuffer target(size);
    EXPECT_EQ(SerializeCredentialList(pointers.data(), 1001, target.data(), &size), 0);
    EXPECT_EQ(size, target.size());
    expectRefused(target.bytes(), {failedCheck("credCount <= 1000")});
}

TEST_F(CredentialList, RoomForTheList) {
    const MemoryList given({4, 12});
    const std::size_t wanted = 4 + 32 + 40;
    for (const std::size_t room :
         {std::size_t{4}, std::size_t{35}, std::size_t{36}, wanted - 1, wanted, wanted + 1}) {
        SCOPED_TRACE(room);
        const ExactBuffer target(room);
        std::size_t size = room;
        const bool fits = room >= wanted;
        EXPECT_EQ(
            SerializeCredentialList(given.pointers.data(), given.count(), target.data(), &size),
            fits ? 0 : -3);
        EXPECT_EQ(size, fits ? wanted : room);
        expectLogged(fits ? Lines() : Lines{failedCheck("credLen <= *outSize"), failedCall()});
    }
}

TEST_F(CredentialList, RoomBelowTheCount) {
    const MemoryList given({4});
    // The four bytes of the count are there whatever the size says.
    const ExactBuffer target(4);
    for (std::size_t room = 0; room < 4; ++room) {
        std::size_t size = room;
        EXPECT_EQ(SerializeCredentialList(given.pointers.data(), 1, target.data(), &size), -3);
        EXPECT_EQ(size, room);
        expectLogged({failedCheck("credLen <= *outSize"), failedCall()});
        EXPECT_EQ(SerializeCredentialList(nullptr, 0, target.data(), &size), 0);
        EXPECT_EQ(size, 4U);
        EXPECT_EQ(target.bytes(), Bytes(4));
    }
}

TEST_F(CredentialList, ElementsThatCannotBeWritten) {
    MemoryList given({4, 12});
    const ExactBuffer target(1000);
    std::size_t size = target.size();
    KSTCredential* kept = given.pointers[1];
    given.pointers[1] = nullptr;
    EXPECT_EQ(SerializeCredentialList(given.pointers.data(), 2, target.data(), &size), -3);
    expectLogged({failedCheck("credentialList[i]")});
    given.pointers[1] = kept;
    support::putU32(given.records[1], 0, 13);
    EXPECT_EQ(SerializeCredentialList(given.pointers.data(), 2, target.data(), &size), -3);
    expectLogged({failedCheck("0"), failedCall(), failedCall()});
    EXPECT_EQ(size, target.size());
}

TEST_F(CredentialList, FailedWriterLeavesWhatItHadWrittenAndTheSizeAsItWas) {
    MemoryList given({4, 12, 4});
    support::putU32(given.records[2], 0, 13);
    const ExactBuffer target(200);
    Bytes expected = target.bytes();
    const Bytes front = listBytes(3, {4, 12});
    std::copy(front.begin(), front.end(), expected.begin());
    std::size_t size = target.size();
    EXPECT_EQ(SerializeCredentialList(given.pointers.data(), 3, target.data(), &size), -3);
    EXPECT_EQ(target.bytes(), expected);
    EXPECT_EQ(size, target.size());
    expectLogged({failedCheck("0"), failedCall(), failedCall()});

    // One byte short for the second: only the count and the first are there.
    const ExactBuffer narrow(4 + 32 + 39);
    expected = narrow.bytes();
    std::copy(front.begin(), front.begin() + 36, expected.begin());
    size = narrow.size();
    EXPECT_EQ(SerializeCredentialList(given.pointers.data(), 3, narrow.data(), &size), -3);
    EXPECT_EQ(narrow.bytes(), expected);
    EXPECT_EQ(size, narrow.size());
    expectLogged({failedCheck("credLen <= *outSize"), failedCall()});
}

TEST_F(CredentialList, NullElementsAreSkippedWhenFreed) {
    ASSERT_EQ(read(listBytes({2, 12, 4})), 0);
    DeallocCredential(list[1]);
    list[1] = nullptr;
    const ScriptedGate gate;
    DeallocCredentialList(list, count);
    EXPECT_EQ(gate.freed, (std::vector<std::size_t>{168, 32, 24}));
    EXPECT_TRUE(gate.everyFreeWasWiped);
    expectLogged({});
}

TEST_F(CredentialList, NullArguments) {
    const MemoryList given({4});
    const Bytes bytes = listBytes({4});
    std::uint8_t target[64];
    std::size_t size = sizeof target;
    const std::pair<KSTStatus, const char*> results[] = {
        {SerializeCredentialList(nullptr, 1, target, &size), "credentialList || (count == 0)"},
        {SerializeCredentialList(given.pointers.data(), 1, nullptr, &size), "outBuffer"},
        {SerializeCredentialList(given.pointers.data(), 1, target, nullptr), "outSize"},
        {DeserializeCredentialList(nullptr, 36, &list, &count), "buffer"},
        {DeserializeCredentialList(bytes.data(), 36, nullptr, &count), "credentialList"},
        {DeserializeCredentialList(bytes.data(), 36, &list, nullptr), "count"},
        {DeserializeCredentialList(bytes.data(), 0, nullptr, nullptr), "credentialList"},
    };
    Lines lines;
    for (const auto& [status, condition] : results) {
        EXPECT_EQ(status, -3) << condition;
        lines.push_back(failedCheck(condition));
    }
    DeallocCredentialList(nullptr, 5);
    lines.push_back(failedCheck("credentialList"));
    expectLogged(lines);
    EXPECT_EQ(list, kUntouchedList);
}
