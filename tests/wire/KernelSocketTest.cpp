#include "wire/KernelSocket.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

namespace {

using Bytes = std::vector<std::uint8_t>;
using wire::KernelOperation;

const Bytes kRequest{'K', 'S', 'T', 'Q', 1, 5, 0, 0, 8, 7, 6, 5, 4, 3, 2, 1};
const Bytes kReply{'K',  'S',  'T',  'R',  1,    3,    0,    0,    0xff, 0xff, 0xff, 0xff,
                   0xff, 0xff, 0xff, 0xff, 0xfb, 0xff, 0xff, 0xff, 4,    3,    2,    1};

Bytes firstOf(const Bytes& bytes, std::size_t length) {
    return {bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length)};
}

Bytes with(Bytes bytes, std::size_t offset, std::uint8_t value) {
    bytes.at(offset) = value;
    return bytes;
}

template <typename Container>
Bytes bytesOf(const Container& container) {
    return {container.begin(), container.end()};
}

Bytes le32(std::uint32_t value) {
    return {static_cast<std::uint8_t>(value), static_cast<std::uint8_t>(value >> 8U),
            static_cast<std::uint8_t>(value >> 16U), static_cast<std::uint8_t>(value >> 24U)};
}

Bytes join(std::initializer_list<Bytes> parts) {
    Bytes whole;
    for (const Bytes& part : parts) {
        whole.insert(whole.end(), part.begin(), part.end());
    }
    return whole;
}

Bytes textBytes(std::string_view text) {
    return bytesOf(text);
}

Bytes scalarBody(std::uint32_t selector, std::uint32_t offered,
                 const std::vector<std::uint64_t>& inputs) {
    const auto count = static_cast<std::uint32_t>(inputs.size());
    return join({bytesOf(wire::encodeKernelScalarPrefix(selector, offered, count)),
                 firstOf(bytesOf(wire::encodeKernelScalars(inputs)), 8 * inputs.size())});
}

/// What both kinds of header refuse in their common 16 bytes.
template <typename Decode>
void expectHeadChecked(const Bytes& valid, Decode decode) {
    ASSERT_TRUE(decode(valid));
    for (std::size_t length = 0; length < valid.size(); ++length) {
        EXPECT_FALSE(decode(firstOf(valid, length))) << "length " << length;
    }
    for (std::size_t offset = 0; offset < 4; ++offset) {
        EXPECT_FALSE(decode(with(valid, offset, valid[offset] ^ 0x20U))) << "magic " << offset;
    }
    for (const int version : {0, 2, 255}) {
        EXPECT_FALSE(decode(with(valid, 4, static_cast<std::uint8_t>(version)))) << version;
    }
    for (int operation = 0; operation < 256; ++operation) {
        const bool known = operation >= 1 && operation <= 6;
        EXPECT_EQ(decode(with(valid, 5, static_cast<std::uint8_t>(operation))).has_value(), known)
            << "operation " << operation;
    }
}

/// `valid` with each of its reserved bytes set to something else than 0.
template <typename Decode>
void expectReserved(const Bytes& valid, Decode decode, bool taken) {
    for (const std::size_t offset : {6U, 7U}) {
        for (const int reserved : {1, 0x80, 0xff}) {
            EXPECT_EQ(decode(with(valid, offset, static_cast<std::uint8_t>(reserved))).has_value(),
                      taken)
                << "reserved " << offset;
        }
    }
}

} // namespace

TEST(KernelRequestHeader, ExactBytes) {
    EXPECT_EQ(
        bytesOf(wire::encodeKernelRequestHeader({KernelOperation::structCall, 0x0102030405060708})),
        kRequest);
    EXPECT_EQ(wire::kKernelRequestHeaderSize, 16U);
}

TEST(KernelRequestHeader, Fields) {
    const auto header = wire::decodeKernelRequestHeader(kRequest);
    ASSERT_TRUE(header);
    EXPECT_EQ(header->operation, KernelOperation::structCall);
    EXPECT_EQ(header->sequence, 0x0102030405060708U);
}

TEST(KernelRequestHeader, RefusesWhatIsNone) {
    expectHeadChecked(kRequest, wire::decodeKernelRequestHeader);
    expectReserved(kRequest, wire::decodeKernelRequestHeader, false);
    EXPECT_FALSE(wire::decodeKernelRequestHeader(kReply));
}

TEST(KernelRequestHeader, BodyMayFollow) {
    Bytes longer = kRequest;
    longer.resize(wire::kKernelMessageMaxSize, 0xee);
    EXPECT_TRUE(wire::decodeKernelRequestHeader(longer));
}

TEST(KernelReplyHeader, ExactBytes) {
    EXPECT_EQ(bytesOf(wire::encodeKernelReplyHeader(
                  {KernelOperation::copyProperty, UINT64_MAX, -5, 0x01020304})),
              kReply);
    EXPECT_EQ(wire::kKernelReplyHeaderSize, 24U);
}

TEST(KernelReplyHeader, Fields) {
    const auto header = wire::decodeKernelReplyHeader(kReply);
    ASSERT_TRUE(header);
    EXPECT_EQ(header->operation, KernelOperation::copyProperty);
    EXPECT_EQ(header->sequence, UINT64_MAX);
    EXPECT_EQ(header->status, -5);
    EXPECT_EQ(header->reported, 0x01020304U);
}

TEST(KernelReplyHeader, RefusesWhatIsNone) {
    expectHeadChecked(kReply, wire::decodeKernelReplyHeader);
    EXPECT_FALSE(wire::decodeKernelReplyHeader(kRequest));
    EXPECT_FALSE(wire::decodeKernelReplyHeader(with(kReply, 3, 'Q')));
}

TEST(KernelReplyHeader, ReservedBytesAreNotLookedAt) {
    expectReserved(kReply, wire::decodeKernelReplyHeader, true);
}

TEST(KernelReplyHeader, StatusesAtTheirEnds) {
    for (const std::int32_t status : {std::numeric_limits<std::int32_t>::min(), -5095, -1, 0, 1,
                                      std::numeric_limits<std::int32_t>::max()}) {
        const auto bytes =
            wire::encodeKernelReplyHeader({KernelOperation::open, 0, status, UINT32_MAX});
        const auto header = wire::decodeKernelReplyHeader(bytes);
        ASSERT_TRUE(header);
        EXPECT_EQ(header->status, status);
        EXPECT_EQ(header->reported, UINT32_MAX);
    }
}

TEST(KernelOperations, Numbers) {
    EXPECT_EQ(static_cast<int>(KernelOperation::findByPath), 1);
    EXPECT_EQ(static_cast<int>(KernelOperation::findByClassName), 2);
    EXPECT_EQ(static_cast<int>(KernelOperation::copyProperty), 3);
    EXPECT_EQ(static_cast<int>(KernelOperation::open), 4);
    EXPECT_EQ(static_cast<int>(KernelOperation::structCall), 5);
    EXPECT_EQ(static_cast<int>(KernelOperation::scalarCall), 6);
}

TEST(KernelFind, TextsAtTheirLimits) {
    EXPECT_FALSE(wire::decodeKernelFindByPath({}));
    EXPECT_EQ(wire::decodeKernelFindByPath(Bytes{'p'}), "p");
    EXPECT_TRUE(wire::decodeKernelFindByPath(Bytes(1024, 'p')));
    EXPECT_FALSE(wire::decodeKernelFindByPath(Bytes(1025, 'p')));
    EXPECT_FALSE(wire::decodeKernelFindByClassName({}));
    EXPECT_EQ(wire::decodeKernelFindByClassName(Bytes{'K', 'e', 'y'}), "Key");
    EXPECT_TRUE(wire::decodeKernelFindByClassName(Bytes(255, 'c')));
    EXPECT_FALSE(wire::decodeKernelFindByClassName(Bytes(256, 'c')));
}

TEST(KernelProperty, ExactBytes) {
    const Bytes body{2, 0, 'p', 'a', 'n', 'a', 'm'};
    EXPECT_EQ(join({bytesOf(wire::encodeKernelPropertyPrefix(2)), textBytes("panam")}), body);
    const auto request = wire::decodeKernelProperty(body);
    ASSERT_TRUE(request);
    EXPECT_EQ(request->path, "pa");
    EXPECT_EQ(request->name, "nam");
}

TEST(KernelProperty, TruncationsThatLeaveNoName) {
    const Bytes body{2, 0, 'p', 'a', 'n'};
    for (std::size_t length = 0; length < body.size(); ++length) {
        EXPECT_FALSE(wire::decodeKernelProperty(firstOf(body, length))) << length;
    }
    EXPECT_TRUE(wire::decodeKernelProperty(body));
}

TEST(KernelProperty, PathLengthAtItsLimits) {
    const auto bodyOf = [](std::size_t pathLength, std::size_t nameLength) {
        Bytes body{static_cast<std::uint8_t>(pathLength),
                   static_cast<std::uint8_t>(pathLength >> 8U)};
        body.insert(body.end(), pathLength, 'p');
        body.insert(body.end(), nameLength, 'n');
        return body;
    };
    EXPECT_FALSE(wire::decodeKernelProperty(bodyOf(0, 1)));
    EXPECT_TRUE(wire::decodeKernelProperty(bodyOf(1, 1)));
    EXPECT_TRUE(wire::decodeKernelProperty(bodyOf(1024, 1)));
    EXPECT_FALSE(wire::decodeKernelProperty(bodyOf(1025, 1)));
    EXPECT_FALSE(wire::decodeKernelProperty(bodyOf(65535, 1)));
    EXPECT_FALSE(wire::decodeKernelProperty(bodyOf(1, 0)));
    EXPECT_TRUE(wire::decodeKernelProperty(bodyOf(1, 255)));
    EXPECT_FALSE(wire::decodeKernelProperty(bodyOf(1, 256)));
    EXPECT_FALSE(wire::decodeKernelProperty(Bytes{0xff, 0xff, 'p', 'n'}));
    EXPECT_FALSE(wire::decodeKernelProperty(Bytes{3, 0, 'p', 'n'}));
}

// The path's length once wrapped at 65536, and the rest of the path became the name.
TEST(KernelProperty, PathBeyondItsLengthFieldIsRefusedNotSplit) {
    for (const std::size_t length : {1025U, 65535U, 65536U, 65537U, 66000U}) {
        const Bytes body = join({bytesOf(wire::encodeKernelPropertyPrefix(length)),
                                 Bytes(length, 'p'), textBytes("n")});
        EXPECT_FALSE(wire::decodeKernelProperty(body)) << length;
    }
}

TEST(KernelOpen, ExactBytes) {
    const Bytes body{4, 3, 2, 1, 'p', 'a'};
    EXPECT_EQ(join({bytesOf(wire::encodeKernelOpenPrefix(0x01020304)), textBytes("pa")}), body);
    const auto request = wire::decodeKernelOpen(body);
    ASSERT_TRUE(request);
    EXPECT_EQ(request->connectionType, 0x01020304U);
    EXPECT_EQ(request->path, "pa");
}

TEST(KernelOpen, TooShortOrTooLong) {
    for (std::size_t length = 0; length <= 4; ++length) {
        EXPECT_FALSE(wire::decodeKernelOpen(Bytes(length))) << length;
    }
    EXPECT_TRUE(wire::decodeKernelOpen(Bytes(5)));
    EXPECT_TRUE(wire::decodeKernelOpen(Bytes(4 + 1024)));
    EXPECT_FALSE(wire::decodeKernelOpen(Bytes(4 + 1025)));
}

TEST(KernelStruct, ExactBytes) {
    EXPECT_EQ(bytesOf(wire::encodeKernelStructPrefix(0x01020304, 0x05060708)),
              (Bytes{4, 3, 2, 1, 8, 7, 6, 5}));
    const Bytes body{0, 0, 0, 0, 0, 1, 0, 0, 'i', 'n'};
    const auto request = wire::decodeKernelStruct(body);
    ASSERT_TRUE(request);
    EXPECT_EQ(request->selector, 0U);
    EXPECT_EQ(request->offeredSize, 256U);
    EXPECT_EQ(bytesOf(request->input), (Bytes{'i', 'n'}));
}

TEST(KernelStruct, EveryTruncationOfThePrefix) {
    for (std::size_t length = 0; length < 8; ++length) {
        EXPECT_FALSE(wire::decodeKernelStruct(Bytes(length))) << length;
    }
    const Bytes prefixOnly(8);
    ASSERT_TRUE(wire::decodeKernelStruct(prefixOnly));
    EXPECT_TRUE(wire::decodeKernelStruct(prefixOnly)->input.empty());
}

TEST(KernelStruct, OfferedSizeAtItsMaximum) {
    const auto request = wire::decodeKernelStruct(join({le32(UINT32_MAX), le32(UINT32_MAX)}));
    ASSERT_TRUE(request);
    EXPECT_EQ(request->selector, UINT32_MAX);
    EXPECT_EQ(request->offeredSize, UINT32_MAX);
}

TEST(KernelScalar, ExactBytes) {
    const Bytes body{2, 0, 0, 0, 1, 0, 0, 0, 2, 0, 0, 0, 8, 7,
                     6, 5, 4, 3, 2, 1, 0, 0, 0, 0, 0, 0, 0, 0x80};
    EXPECT_EQ(scalarBody(2, 1, {0x0102030405060708, 0x8000000000000000}), body);
    const auto request = wire::decodeKernelScalar(body);
    ASSERT_TRUE(request);
    EXPECT_EQ(request->selector, 2U);
    EXPECT_EQ(request->offeredCount, 1U);
    EXPECT_EQ(request->inputs,
              (std::vector<std::uint64_t>{0x0102030405060708, 0x8000000000000000}));
}

TEST(KernelScalar, WithoutInputs) {
    const Bytes body{2, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0};
    EXPECT_EQ(scalarBody(2, 1, {}), body);
    ASSERT_TRUE(wire::decodeKernelScalar(body));
    EXPECT_TRUE(wire::decodeKernelScalar(body)->inputs.empty());
}

TEST(KernelScalar, EveryTruncationAndATrailingByte) {
    Bytes body = scalarBody(2, 1, {1, 2});
    for (std::size_t length = 0; length < body.size(); ++length) {
        EXPECT_FALSE(wire::decodeKernelScalar(firstOf(body, length))) << length;
    }
    body.push_back(0);
    EXPECT_FALSE(wire::decodeKernelScalar(body));
}

TEST(KernelScalar, CountsAtTheirLimits) {
    for (const std::uint32_t count : {0U, 1U, 15U, 16U}) {
        EXPECT_TRUE(wire::decodeKernelScalar(join({le32(2), le32(count), le32(0)}))) << count;
        EXPECT_TRUE(wire::decodeKernelScalar(
            join({le32(2), le32(0), le32(count), Bytes(std::size_t{8} * count)})))
            << count;
    }
    EXPECT_FALSE(wire::decodeKernelScalar(join({le32(2), le32(17), le32(0)})));
    EXPECT_FALSE(wire::decodeKernelScalar(join({le32(2), le32(UINT32_MAX), le32(0)})));
    EXPECT_FALSE(wire::decodeKernelScalar(join({le32(2), le32(0), le32(17), Bytes(8 * 17)})));
    EXPECT_FALSE(wire::decodeKernelScalar(join({le32(2), le32(0), le32(UINT32_MAX)})));
    // Eight times this wraps to 0 in 32 bits.
    EXPECT_FALSE(wire::decodeKernelScalar(join({le32(2), le32(0), le32(0x20000000)})));
}

TEST(KernelScalars, AsManyAsThereCanBe) {
    const std::vector<std::uint64_t> all(16, UINT64_MAX);
    EXPECT_EQ(bytesOf(wire::encodeKernelScalars(all)), Bytes(8 * 16, 0xff));
    EXPECT_EQ(bytesOf(wire::encodeKernelScalars({})), Bytes(8 * 16, 0));
}

TEST(KernelScalars, MustMatchTheirCount) {
    std::vector<std::uint64_t> scalars;
    EXPECT_TRUE(wire::decodeKernelScalars({}, scalars));
    EXPECT_FALSE(wire::decodeKernelScalars(Bytes(8), scalars));
    scalars.assign(1, 9);
    for (const std::size_t size : {0U, 7U, 9U, 16U}) {
        EXPECT_FALSE(wire::decodeKernelScalars(Bytes(size), scalars)) << size;
        EXPECT_EQ(scalars.front(), 9U);
    }
    EXPECT_TRUE(wire::decodeKernelScalars(Bytes{40, 0, 0, 0, 0, 0, 0, 0}, scalars));
    EXPECT_EQ(scalars.front(), 40U);
    scalars.assign(16, 9);
    EXPECT_TRUE(wire::decodeKernelScalars(Bytes(8 * 16, 0xff), scalars));
    EXPECT_EQ(scalars, std::vector<std::uint64_t>(16, UINT64_MAX));
    scalars.assign(17, 9);
    EXPECT_FALSE(wire::decodeKernelScalars(Bytes(8 * 17), scalars));
}
