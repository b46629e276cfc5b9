#include "KSTLib/RequestSerialization.h"
#include "common/Allocation.h"
#include "common/SerializationContext.h"

#include <array>
#include <string.h>

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
