#include "common/ParameterWire.h"

#include "KSTLib/RequestSerialization.h"
#include "common/Allocation.h"
#include "common/AssertLine.h"
#include "common/SerializationContext.h"

#include <utility>

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
    return err != kKSTErrorSuccess ? err
                                   : serializationContext().requireArguments({
                                         Argument(outBuffer, "outBuffer"),
                                         Argument(outSize, "outSize"),
                                     });
}

KSTStatus checkParameters(const KSTParameter* parameters, std::uint32_t parametersCount) noexcept {
    for (std::uint32_t i = 0; i < parametersCount; ++i) {
        const KSTParameter& param = parameters[i];
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
    if (!reader.readU32(param.type) || !reader.readU32(param.parameterDataLength)) {
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

} // namespace kst
