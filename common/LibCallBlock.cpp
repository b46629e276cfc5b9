#include "KSTLib/Command.h"
#include "KSTLib/LibCall.h"
#include "common/LibCallReport.h"
#include "common/NumberedPayload.h"
#include "common/RequiredFunction.h"
#include "common/WipedBytes.h"

namespace {

constexpr const char* kSourcePath = "common/LibCallBlock";
constexpr const char* kReplySizeCheck = "outSize <= sizeof(outBuffer)";

void handOver(const KSTDataBlock& block, const std::uint8_t* bytes, std::size_t size) {
    block.invoke(block.captured, size > 0 ? bytes : nullptr, size);
}

KSTStatus getEnvironmentVariable(KSTTransport transport, void* transportContext,
                                 std::uint32_t variable, const KSTDataBlock& processVariable) {
    const kst::AssertionContext context = kst::libCallContext(kSourcePath);
    KSTStatus err = kst::requireFunction(context, transport, "transport");
    if (err == kKSTErrorSuccess) {
        err = kst::requireBlock(context, processVariable, "processVariable");
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const kst::NumberedPayload payload(variable, nullptr, 0, context);
    kst::WipedBytes<kKSTEnvironmentVariableMaxSize> outBuffer;
    std::size_t outSize = outBuffer.size();
    err = transport(transportContext, kKSTCommandGetEnvironmentVariable, 0, payload.data(),
                    payload.size(), outBuffer.data(), &outSize);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    if (outSize > outBuffer.size()) {
        return kst::fail(context, kReplySizeCheck, 0, kKSTErrorUnexpected);
    }
    handOver(processVariable, outBuffer.data(), outSize);
    return kKSTErrorSuccess;
}

KSTStatus kernelControl(KSTTransport transport, void* transportContext, std::uint32_t code,
                        const void* data, std::size_t dataLength, const KSTDataBlock& resultBlock) {
    const kst::AssertionContext context = kst::libCallContext(kSourcePath);
    KSTStatus err = kst::requireFunction(context, transport, "transport");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    static_assert(kKSTKernelControlMaxSize == 256, "the text below names it");
    if (!((data && dataLength > 0 && dataLength <= kKSTKernelControlMaxSize) ||
          (!data && dataLength == 0))) {
        return kst::fail(context,
                         "(data && dataLength && dataLength <= 256) || (!data && !dataLength)", 0,
                         kKSTErrorBadParameter);
    }
    const kst::NumberedPayload payload(code, data, dataLength, context);
    kst::WipedBytes<kKSTKernelControlMaxSize> outBuffer;
    std::size_t outSize = outBuffer.size();
    err = transport(transportContext, kKSTCommandKernelControl, 0, payload.data(), payload.size(),
                    outBuffer.data(), &outSize);
    if (err != kKSTErrorSuccess) {
        static_cast<void>(kst::failCall(context, err));
    }
    if (outSize > outBuffer.size()) {
        outSize = 0;
        if (err == kKSTErrorSuccess) {
            err = kst::fail(context, kReplySizeCheck, 0, kKSTErrorUnexpected);
        }
    }
    if (resultBlock.invoke != nullptr) {
        handOver(resultBlock, outBuffer.data(), outSize);
    }
    return err;
}

} // namespace

KSTStatus LibCall_KSTGetEnvironmentVariable_Block(KSTTransport transport, void* transportContext,
                                                  std::uint32_t variable,
                                                  KSTDataBlock processVariable) noexcept {
    return kst::printReturn(
        __func__, getEnvironmentVariable(transport, transportContext, variable, processVariable));
}

KSTStatus LibCall_KSTKernelControl_Block(KSTTransport transport, void* transportContext,
                                         std::uint32_t code, const void* data,
                                         std::size_t dataLength,
                                         KSTDataBlock resultBlock) noexcept {
    return kst::printReturn(
        __func__, kernelControl(transport, transportContext, code, data, dataLength, resultBlock));
}
