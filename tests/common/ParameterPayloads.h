#pragma once

#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "tests/common/SerializationFixture.h"

#include <array>
#include <cstring>
#include <optional>
#include <string>
#include <vector>

/// The three payloads that end in parameters, behind one face, so that what they share is tested
/// once.
namespace support {

struct ParameterValue {
    std::uint32_t type;
    Bytes data;

    bool operator==(const ParameterValue& other) const {
        return type == other.type && data == other.data;
    }
};

inline Bytes wireOf(const std::vector<ParameterValue>& parameters) {
    Bytes bytes;
    for (const ParameterValue& parameter : parameters) {
        const std::size_t at = bytes.size();
        bytes.resize(at + 8);
        putU32(bytes, at, parameter.type);
        putU32(bytes, at + 4, static_cast<std::uint32_t>(parameter.data.size()));
        append(bytes, parameter.data);
    }
    return bytes;
}

/// Parameters as a caller gives them. Points into what it was made from.
class ParameterArray {
  public:
    explicit ParameterArray(const std::vector<ParameterValue>& values) {
        for (const ParameterValue& value : values) {
            parameters_.push_back({value.type, value.data.empty() ? nullptr : value.data.data(),
                                   static_cast<std::uint32_t>(value.data.size())});
        }
    }

    [[nodiscard]] KSTParameter* data() {
        return parameters_.empty() ? nullptr : parameters_.data();
    }
    [[nodiscard]] std::uint32_t count() const {
        return static_cast<std::uint32_t>(parameters_.size());
    }
    KSTParameter& operator[](std::size_t index) { return parameters_[index]; }

  private:
    std::vector<KSTParameter> parameters_;
};

/// Where in a payload, up to and without `end`, it breaks off with which failed check.
struct Cut {
    std::size_t end;
    const char* check;
};

inline constexpr const char* kHandleCut = "(size - offset) >= sizeof(KSTHandle)";
inline constexpr const char* kByteCut = "(size - offset) >= sizeof(uint8_t)";
inline constexpr const char* kWordCut = "(size - offset) >= sizeof(uint32_t)";

/// What a payload says, without what is the same in every test: the handle 1 to 16, the blobs of
/// the kind and the preflight byte 1 where there is one.
struct Said {
    std::uint32_t age = 0;
    std::vector<ParameterValue> parameters;
};

inline KSTHandle countingHandle() {
    KSTHandle handle{};
    for (std::size_t i = 0; i < sizeof handle.bytes; ++i) {
        handle.bytes[i] = static_cast<std::uint8_t>(i + 1);
    }
    return handle;
}

/// The outputs that every reader has, with values that tell whether they were touched.
struct Outputs {
    static constexpr std::uint8_t kUntouched = 0xee;

    Outputs() { std::memset(&handle, kUntouched, sizeof handle); }

    [[nodiscard]] bool handleIsUntouched() const { return handle.bytes[0] == kUntouched; }

    KSTHandle handle{};
    std::uint32_t age = 4711;
    KSTParameter* parameters = reinterpret_cast<KSTParameter*>(0x10);
    std::uint32_t count = 4711;

    /// What was read; the parameters are released.
    Said take() {
        Said said{age, {}};
        for (std::uint32_t i = 0; i < count; ++i) {
            const auto* data = static_cast<const std::uint8_t*>(parameters[i].parameterData);
            EXPECT_EQ(data == nullptr, parameters[i].parameterDataLength == 0);
            said.parameters.push_back(
                {parameters[i].type, Bytes(data, data + parameters[i].parameterDataLength)});
        }
        EXPECT_EQ(parameters == nullptr, count == 0);
        DeallocParameters(parameters, count);
        return said;
    }

    void expectUntouched() const {
        EXPECT_EQ(age, 4711U);
        EXPECT_EQ(parameters, reinterpret_cast<KSTParameter*>(0x10));
        EXPECT_EQ(count, 4711U);
    }
};

/// A blob that a reader handed out, released.
inline Bytes takeBlob(void* data, std::size_t length) {
    const auto* bytes = static_cast<const std::uint8_t*>(data);
    EXPECT_EQ(data == nullptr, length == 0);
    Bytes copy(bytes, bytes + length);
    DeallocDataBlob(data, length);
    return copy;
}

struct VerifyPolicyKind {
    using Size = std::size_t;
    static constexpr std::size_t kUnwrittenSize = 0;
    static constexpr std::size_t kBlobAllocations = 1;

    /// The policy "ab".
    static Bytes front() {
        return {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 'a', 'b', 0, 1};
    }
    static std::vector<Cut> cuts() {
        return {{16, kHandleCut},
                {19, "(size - offset) >= (policyLength + 1)"},
                {20, kByteCut},
                {28, kWordCut}};
    }

    static KSTStatus announce(const KSTParameter* parameters, std::uint32_t count, Size* size) {
        const KSTHandle handle = countingHandle();
        return GetSerializedVerifyPolicySize(&handle, "ab", 1, 0, parameters, count, size);
    }
    static KSTStatus write(std::uint32_t age, const KSTParameter* parameters, std::uint32_t count,
                           void* buffer, Size* size) {
        const KSTHandle handle = countingHandle();
        return SerializeVerifyPolicy(&handle, "ab", 1, age, parameters, count, buffer, size);
    }
    static KSTStatus read(const ExactBuffer& buffer, std::optional<Said>& said) {
        Outputs out;
        char* policy = nullptr;
        std::uint8_t preflight = 0xee;
        const KSTStatus err =
            DeserializeVerifyPolicy(buffer.data(), buffer.size(), &out.handle, &policy, &preflight,
                                    &out.age, &out.parameters, &out.count);
        EXPECT_EQ(out.handleIsUntouched(), buffer.size() < 16);
        if (err != kKSTErrorSuccess) {
            EXPECT_EQ(policy, nullptr);
            EXPECT_EQ(preflight, 0xee);
            out.expectUntouched();
            return err;
        }
        EXPECT_EQ(takeBlob(policy, 3), (Bytes{'a', 'b', 0}));
        EXPECT_EQ(preflight, 1);
        said = out.take();
        return err;
    }
};

struct VerifyAclKind {
    using Size = std::uint32_t;
    static constexpr std::size_t kUnwrittenSize = 4;
    static constexpr std::size_t kBlobAllocations = 1;

    /// The constraint 7, 8, 9.
    static Bytes front() {
        return {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 3, 0, 0, 0, 7, 8, 9, 1};
    }
    static std::vector<Cut> cuts() {
        return {{16, kHandleCut},
                {20, kWordCut},
                {23, "(size - offset) >= constraintLength"},
                {24, kByteCut},
                {32, kWordCut}};
    }

    static KSTStatus announce(const KSTParameter* parameters, std::uint32_t count, Size* size) {
        return GetSerializedVerifyAclConstraintSize(nullptr, kConstraint.data(), 3, 1, 0,
                                                    parameters, count, size);
    }
    static KSTStatus write(std::uint32_t age, const KSTParameter* parameters, std::uint32_t count,
                           void* buffer, Size* size) {
        const KSTHandle handle = countingHandle();
        return SerializeVerifyAclConstraint(&handle, kConstraint.data(), 3, 1, age, parameters,
                                            count, buffer, size);
    }
    static KSTStatus read(const ExactBuffer& buffer, std::optional<Said>& said) {
        Outputs out;
        void* constraint = nullptr;
        std::uint32_t length = 4711;
        std::uint8_t preflight = 0xee;
        const KSTStatus err = DeserializeVerifyAclConstraint(
            buffer.data(), static_cast<std::uint32_t>(buffer.size()), &out.handle, &constraint,
            &length, &preflight, &out.age, &out.parameters, &out.count);
        EXPECT_EQ(out.handleIsUntouched(), buffer.size() < 16);
        if (err != kKSTErrorSuccess) {
            EXPECT_EQ(constraint, nullptr);
            EXPECT_EQ(length, 4711U);
            EXPECT_EQ(preflight, 0xee);
            out.expectUntouched();
            return err;
        }
        EXPECT_EQ(takeBlob(constraint, length), (Bytes{7, 8, 9}));
        EXPECT_EQ(preflight, 1);
        said = out.take();
        return err;
    }

  private:
    static constexpr std::array<std::uint8_t, 3> kConstraint = {7, 8, 9};
};

struct ProcessAclKind {
    using Size = std::uint32_t;
    static constexpr std::size_t kUnwrittenSize = 4;
    static constexpr std::size_t kBlobAllocations = 2;

    /// The list 7, 8, 9 and the operation "ok".
    static Bytes front() {
        return {1,  2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13,  14, 15,
                16, 3, 0, 0, 0, 7, 8, 9, 2, 0,  0,  0,  'o', 'k'};
    }
    static std::vector<Cut> cuts() {
        return {{16, kHandleCut},
                {20, kWordCut},
                {23, "(size - offset) >= tmpAclLength"},
                {27, kWordCut},
                {29, "(size - offset) >= opLen"},
                {37, kWordCut}};
    }

    static KSTStatus announce(const KSTParameter* parameters, std::uint32_t count, Size* size) {
        return GetSerializedProcessAclSize(nullptr, kAcl.data(), 3, "ok", 2, 0, parameters, count,
                                           size);
    }
    static KSTStatus write(std::uint32_t age, const KSTParameter* parameters, std::uint32_t count,
                           void* buffer, Size* size) {
        const KSTHandle handle = countingHandle();
        return SerializeProcessAcl(&handle, kAcl.data(), 3, "ok", 2, age, parameters, count, buffer,
                                   size);
    }
    static KSTStatus read(const ExactBuffer& buffer, std::optional<Said>& said) {
        Outputs out;
        void* acl = nullptr;
        std::uint32_t aclLength = 4711;
        void* operation = nullptr;
        std::uint32_t operationLength = 4711;
        const KSTStatus err = DeserializeProcessAcl(
            buffer.data(), static_cast<std::uint32_t>(buffer.size()), &out.handle, &acl, &aclLength,
            &operation, &operationLength, &out.age, &out.parameters, &out.count);
        EXPECT_EQ(out.handleIsUntouched(), buffer.size() < 16);
        if (err != kKSTErrorSuccess) {
            EXPECT_EQ(acl, nullptr);
            EXPECT_EQ(aclLength, 4711U);
            EXPECT_EQ(operation, nullptr);
            EXPECT_EQ(operationLength, 4711U);
            out.expectUntouched();
            return err;
        }
        EXPECT_EQ(takeBlob(acl, aclLength), (Bytes{7, 8, 9}));
        EXPECT_EQ(takeBlob(operation, operationLength), (Bytes{'o', 'k'}));
        said = out.take();
        return err;
    }

  private:
    static constexpr std::array<std::uint8_t, 3> kAcl = {7, 8, 9};
};

} // namespace support
