#include "KSTLib/ParameterSerialization.h"
#include "base/ByteReader.h"
#include "kstctl/decode/CredentialFields.h"
#include "kstctl/decode/ParameterFields.h"

namespace kstctl::decode {

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

} // namespace kstctl::decode
