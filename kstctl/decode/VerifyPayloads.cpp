#include "KSTLib/Contexts.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/RequestSerialization.h"
#include "KSTLib/Serialization.h"
#include "base/ByteReader.h"
#include "base/NotCopied.h"
#include "base/Saturate.h"
#include "kstctl/Report.h"
#include "kstctl/decode/Decoded.h"
#include "kstctl/decode/Payloads.h"

#include <cstddef>
#include <string_view>

namespace kstctl::decode {

/// Bytes that a deserialiser hands out, given back at the end of the scope.
struct ReceivedBlob : private base::NotCopied {
    ~ReceivedBlob() { DeallocDataBlob(data, length); }

    [[nodiscard]] Bytes bytes() const { return {static_cast<const std::uint8_t*>(data), length}; }

    void* data = nullptr;
    std::uint32_t length = 0;
};

/// The parameters of a verify request as a deserialiser hands them out, given back at the end of
/// the scope.
struct ReceivedParameters : private base::NotCopied {
    ~ReceivedParameters();

    /// What they take on the wire, their number not counted.
    [[nodiscard]] std::size_t wireSize() const;
    [[nodiscard]] Data fields() const;

    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
};

namespace {

constexpr std::size_t kHeadSize = 4 + 4;
constexpr std::uint32_t kUserType = 4;

bool isSignedNumber(std::uint32_t type) {
    return type == 1 || type == 5;
}

Report fieldsOf(const KSTParameter& parameter) {
    const Bytes value(static_cast<const std::uint8_t*>(parameter.parameterData),
                      parameter.parameterDataLength);
    Report report;
    report.add("type", parameter.type).add("length", parameter.parameterDataLength);
    std::uint32_t number = 0;
    if (base::ByteReader reader(value); !reader.readU32(number)) {
        number = 0;
    }
    if (isSignedNumber(parameter.type)) {
        report.add("value", static_cast<std::int32_t>(number), "number");
    } else if (parameter.type == kUserType) {
        report.add("value", number, number == kKSTCredentialNoUser ? "no user" : "user");
    } else {
        report.add("value", hexText(value));
    }
    return report;
}

} // namespace

ReceivedParameters::~ReceivedParameters() {
    DeallocParameters(parameters, count);
}

std::size_t ReceivedParameters::wireSize() const {
    std::size_t size = 0;
    for (std::uint32_t i = 0; i < count; ++i) {
        size += kHeadSize + parameters[i].parameterDataLength;
    }
    return size;
}

Data ReceivedParameters::fields() const {
    Data list;
    for (std::uint32_t i = 0; i < count; ++i) {
        list.emplace_back(fieldsOf(parameters[i]));
    }
    return list;
}

namespace {

constexpr std::size_t kFixedPolicySize = kKSTHandleSize + 1 + 1 + 4 + 4;

} // namespace

Result decodeVerifyPolicy(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    char* made = nullptr;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a verify-policy payload", [&] {
            return DeserializeVerifyPolicy(bytes.data(), bytes.size(), &handle, &made, &preflight,
                                           &age, &parameters.parameters, &parameters.count);
        })) {
        return *std::move(refusal);
    }
    const std::size_t length = std::string_view(made).size();
    const Received<char> policy(made, [length](char* text) { DeallocDataBlob(text, length + 1); });
    Decoded decoded{.fields = {}, .size = kFixedPolicySize + length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("policy", std::string_view(policy.get()))
        .add("preflight", preflight != 0)
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

namespace {

constexpr std::size_t kFixedAclSize = kKSTHandleSize + 4 + 1 + 4 + 4;

} // namespace

Result decodeVerifyAclConstraint(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    ReceivedBlob constraint;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a verify-acl-constraint payload", [&] {
            return DeserializeVerifyAclConstraint(
                bytes.data(), base::saturate<std::uint32_t>(bytes.size()), &handle,
                &constraint.data, &constraint.length, &preflight, &age, &parameters.parameters,
                &parameters.count);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {},
                    .size = kFixedAclSize + constraint.length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("constraint", hexText(constraint.bytes()))
        .add("preflight", preflight != 0)
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

namespace {

constexpr std::size_t kFixedSize = kKSTHandleSize + 4 + 4 + 4 + 4;

} // namespace

Result decodeProcessAcl(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    ReceivedBlob acl;
    ReceivedBlob operation;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a parse-acl payload", [&] {
            return DeserializeProcessAcl(bytes.data(), base::saturate<std::uint32_t>(bytes.size()),
                                         &handle, &acl.data, &acl.length, &operation.data,
                                         &operation.length, &age, &parameters.parameters,
                                         &parameters.count);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {},
                    .size = kFixedSize + acl.length + operation.length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("acl", hexText(acl.bytes()))
        .add("operation", hexText(operation.bytes()))
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

} // namespace kstctl::decode
