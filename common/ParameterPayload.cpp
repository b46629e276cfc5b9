#include "common/ParameterPayload.h"

#include "KSTLib/RequestSerialization.h"
#include "common/Allocation.h"
#include "common/ContextObject.h"
#include "common/Failure.h"

#include <array>
#include <string.h>
#include <utility>

namespace {

struct LengthRule {
    std::uint32_t least;
    std::uint32_t most;
    const char* check;
};

static_assert(kKSTParameterMaxDataLength == 1000, "the text below names it");

/// By type.
constexpr std::array<LengthRule, 8> kLengthRules = {{
    {0, 0, "!param->parameterDataLength"},
    {4, 4, "param->parameterDataLength == sizeof(int32_t)"},
    {16, 16, "param->parameterDataLength == 16"},
    {1, kKSTParameterMaxDataLength,
     "param->parameterDataLength && (param->parameterDataLength <= 1000)"},
    {4, 4, "param->parameterDataLength == sizeof(uid_t)"},
    {4, 4, "param->parameterDataLength == sizeof(int32_t)"},
    {16, 16, "param->parameterDataLength == 16"},
    {16, 16, "param->parameterDataLength == 16"},
}};

constexpr std::uint32_t kParameterHeaderSize = sizeof(KSTParameterType) + sizeof(std::uint32_t);

/// Wipes twice: here and in `release`.
void wipeAndRelease(void* memory, std::size_t size) {
    if (memory != nullptr) {
        ::explicit_bzero(memory, size);
        kst::release(memory, size);
    }
}

} // namespace

KSTStatus ValidateParameter(const KSTParameter* parameter) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    if (parameter == nullptr) {
        return kst::fail(context, "param", 0, kKSTErrorBadParameter);
    }
    if (parameter->type >= kLengthRules.size()) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    const LengthRule& rule = kLengthRules[parameter->type];
    if (parameter->parameterDataLength < rule.least || parameter->parameterDataLength > rule.most) {
        return kst::fail(context, rule.check, 0, kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

KSTStatus GetSerializedParametersLength(const KSTParameter* parameters,
                                        std::uint32_t parametersCount,
                                        std::uint32_t* outLength) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    if (outLength == nullptr) {
        return kst::fail(context, "paramsLength", 0, kKSTErrorBadParameter);
    }
    *outLength = 0;
    std::uint32_t length = 0;
    for (std::uint32_t i = 0; i < parametersCount; ++i) {
        const KSTParameter* parameter = parameters != nullptr ? &parameters[i] : nullptr;
        const KSTStatus err = ValidateParameter(parameter);
        if (err != kKSTErrorSuccess) {
            return kst::failCall(context, err);
        }
        length += kParameterHeaderSize;
        // A null parameter is not valid. NOLINTNEXTLINE(clang-analyzer-core.*)
        if (length + parameter->parameterDataLength <= length) {
            return kst::fail(context,
                             "parametersLength + param->parameterDataLength > parametersLength", 0,
                             kKSTErrorBadParameter);
        }
        length += parameter->parameterDataLength;
    }
    *outLength = length;
    return kKSTErrorSuccess;
}

void DeallocParameters(KSTParameter* parameters, std::uint32_t parametersCount) noexcept {
    if (parameters == nullptr) {
        return;
    }
    for (std::uint32_t i = 0; i < parametersCount; ++i) {
        wipeAndRelease(const_cast<void*>(parameters[i].parameterData),
                       parameters[i].parameterDataLength);
    }
    wipeAndRelease(parameters, parametersCount * sizeof(KSTParameter));
}

namespace kst {

namespace {

constexpr const char* kWordCheck = "(size - offset) >= sizeof(uint32_t)";

} // namespace

KSTStatus checkParameterList(const KSTParameter* parameters,
                             std::uint32_t parametersCount) noexcept {
    if ((parameters != nullptr) != (parametersCount != 0)) {
        return fail(serializationContext(),
                    "(parameters && parametersCount) || (!parameters && !parametersCount)", 0,
                    kKSTErrorBadParameter);
    }
    static_assert(kKSTMaxParameters == 10, "the text below names it");
    if (parametersCount > kKSTMaxParameters) {
        return fail(serializationContext(), "parametersCount <= 10", 0, kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}

KSTStatus measureParameters(const KSTParameter* parameters, std::uint32_t parametersCount,
                            std::uint32_t& length) noexcept {
    const KSTStatus err = GetSerializedParametersLength(parameters, parametersCount, &length);
    return err == kKSTErrorSuccess
               ? err
               : fail(serializationContext(), "err == kKSTErrorSuccess", 0, err);
}

KSTStatus checkWriter(const KSTParameter* parameters, std::uint32_t parametersCount,
                      const void* outBuffer, const void* outSize) noexcept {
    const KSTStatus err = checkParameterList(parameters, parametersCount);
    return err != kKSTErrorSuccess
               ? err
               : kst::requireArguments(serializationContext(), {
                                                                   Argument(outBuffer, "outBuffer"),
                                                                   Argument(outSize, "outSize"),
                                                               });
}

KSTStatus checkParameters(const KSTParameter* parameters, std::uint32_t parametersCount) noexcept {
    for (std::uint32_t i = 0; i < parametersCount; ++i) {
        const KSTParameter& param = parameters[i];
        // Valid when it was measured; the list is the caller's, who may have changed it since.
        const KSTStatus err = ValidateParameter(&param);
        if (err != kKSTErrorSuccess) {
            return failCall(serializationContext(), err);
        }
        if (param.parameterData == nullptr && param.parameterDataLength != 0) {
            return fail(serializationContext(),
                        "param->parameterData || !param->parameterDataLength", 0,
                        kKSTErrorBadParameter);
        }
    }
    return kKSTErrorSuccess;
}

bool writeParameters(base::ByteWriter& writer, const KSTParameter* parameters,
                     std::uint32_t parametersCount) noexcept {
    bool fits = writer.writeU32(parametersCount);
    for (std::uint32_t i = 0; i < parametersCount && fits; ++i) {
        fits = writer.writeU32(parameters[i].type) &&
               writer.writeU32(parameters[i].parameterDataLength) &&
               writer.writeBytes(parameters[i].parameterData, parameters[i].parameterDataLength);
    }
    return fits;
}

ReceivedParameters::~ReceivedParameters() {
    DeallocParameters(parameters_, parametersCount_);
}

KSTStatus ReceivedParameters::read(base::ByteReader& reader) noexcept {
    const AssertionContext context = serializationContext();
    std::uint32_t count = 0;
    if (!reader.readU32(maxGlobalCredentialAge_) || !reader.readU32(count)) {
        return fail(context, kWordCheck, 0, kKSTErrorBadParameter);
    }
    if (count > kKSTMaxParameters) {
        return fail(context, "paramsCount <= 10", 0, kKSTErrorBadParameter);
    }
    if (count == 0) {
        return kKSTErrorSuccess;
    }
    parameters_ = static_cast<KSTParameter*>(allocate(count * sizeof(KSTParameter)));
    if (parameters_ == nullptr) {
        return fail(context, "params", 0, kKSTErrorOutOfMemory);
    }
    parametersCount_ = count;
    for (std::uint32_t i = 0; i < count; ++i) {
        const KSTStatus err = readElement(reader, parameters_[i]);
        if (err != kKSTErrorSuccess) {
            return err;
        }
    }
    return kKSTErrorSuccess;
}

/// `element` gets its length only together with its memory, so that it can be released at any time.
KSTStatus ReceivedParameters::readElement(base::ByteReader& reader,
                                          KSTParameter& element) noexcept {
    const AssertionContext context = serializationContext();
    KSTParameter param{};
    if (reader.left() < sizeof(KSTParameterType) + sizeof(std::uint32_t)) {
        return fail(context, "(size - offset) >= sizeof(KSTParameterType) + sizeof(uint32_t)", 0,
                    kKSTErrorBadParameter);
    }
    static_cast<void>(reader.readU32(param.type));
    // Counted above, and asked again like every length of the payload.
    if (!reader.readU32(param.parameterDataLength)) {
        return fail(context, kWordCheck, 0, kKSTErrorBadParameter);
    }
    if (reader.left() < param.parameterDataLength) {
        return fail(context, "(size - offset) >= params[i].parameterDataLength", 0,
                    kKSTErrorBadParameter);
    }
    const KSTStatus err = ValidateParameter(&param);
    if (err != kKSTErrorSuccess) {
        return failCall(context, err);
    }
    if (param.parameterDataLength != 0) {
        void* data = allocate(param.parameterDataLength);
        if (data == nullptr) {
            return fail(context, "params[i].parameterData", 0, kKSTErrorOutOfMemory);
        }
        static_cast<void>(reader.readBytes(data, param.parameterDataLength));
        param.parameterData = data;
    }
    element = param;
    return kKSTErrorSuccess;
}

void ReceivedParameters::handOut(std::uint32_t& maxGlobalCredentialAge, KSTParameter*& parameters,
                                 std::uint32_t& parametersCount) noexcept {
    maxGlobalCredentialAge = maxGlobalCredentialAge_;
    parameters = std::exchange(parameters_, nullptr);
    parametersCount = std::exchange(parametersCount_, 0U);
}

KSTStatus PayloadReader::readHandle() noexcept {
    return kst::readHandle(rest_, *outputs_.handle)
               ? kKSTErrorSuccess
               : fail(serializationContext(), "(size - offset) >= sizeof(KSTHandle)", 0,
                      kKSTErrorBadParameter);
}

KSTStatus PayloadReader::readFlag(std::uint8_t& flag) noexcept {
    std::uint8_t byte = 0;
    if (!rest_.readU8(byte)) {
        return fail(serializationContext(), "(size - offset) >= sizeof(uint8_t)", 0,
                    kKSTErrorBadParameter);
    }
    flag = byte != 0 ? 1 : 0;
    return kKSTErrorSuccess;
}

KSTStatus PayloadReader::finish() noexcept {
    const KSTStatus err = parameters_.read(rest_);
    if (err == kKSTErrorSuccess) {
        parameters_.handOut(*outputs_.maxGlobalCredentialAge, *outputs_.parameters,
                            *outputs_.parametersCount);
    }
    return err;
}

} // namespace kst
