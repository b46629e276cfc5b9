#include "KSTLib/LibCall.h"

#include "KSTLib/Command.h"
#include "common/Allocation.h"
#include "common/Failure.h"
#include "common/PayloadMemory.h"

#include <cstring>
#include <limits>

namespace {

constexpr const char* kSourcePath = "common/LibCall";

KSTStatus setEnvironmentVariable(KSTTransport transport, void* transportContext,
                                 std::uint32_t variable, const void* data, std::size_t dataLength) {
    const kst::AssertionContext context = kst::libCallContext(kSourcePath);
    const KSTStatus missing =
        kst::requireArguments(context, {kst::Argument(transport, "transport")});
    if (missing != kKSTErrorSuccess) {
        return missing;
    }
    static_assert(kKSTEnvironmentVariableMaxSize == 64, "the text below names it");
    if (!((data && dataLength > 0 && dataLength <= kKSTEnvironmentVariableMaxSize) ||
          (!data && dataLength == 0))) {
        return kst::fail(context,
                         "(data && dataLength && dataLength <= 64) || (!data && !dataLength)", 0,
                         kKSTErrorBadParameter);
    }
    const kst::NumberedPayload payload(variable, data, dataLength, context);
    const KSTStatus err = transport(transportContext, kKSTCommandSetEnvironmentVariable, 0,
                                    payload.data(), payload.size(), nullptr, nullptr);
    return err == kKSTErrorSuccess ? err : kst::failCall(context, err);
}

} // namespace

std::uint8_t* LibCall_BuildCommand(std::uint8_t code, std::uint8_t secondByte,
                                   std::uint8_t thirdByte, const void* payload,
                                   std::size_t payloadSize, std::size_t* outFrameSize) noexcept {
    if (outFrameSize == nullptr || (payload == nullptr && payloadSize > 0) ||
        payloadSize > std::numeric_limits<std::size_t>::max() - kKSTCommandHeaderSize) {
        return nullptr;
    }
    const std::size_t frameSize = kKSTCommandHeaderSize + payloadSize;
    auto* frame = static_cast<std::uint8_t*>(kst::allocate(frameSize));
    if (frame == nullptr) {
        return nullptr;
    }
    kst::writeCommandHeader(frame, code, secondByte, thirdByte);
    if (payloadSize > 0) {
        std::memcpy(frame + kKSTCommandHeaderSize, payload, payloadSize);
    }
    *outFrameSize = frameSize;
    return frame;
}

KSTStatus LibCall_KSTSetEnvironmentVariable(KSTTransport transport, void* transportContext,
                                            std::uint32_t variable, const void* data,
                                            std::size_t dataLength) noexcept {
    return kst::printReturn(
        __func__, setEnvironmentVariable(transport, transportContext, variable, data, dataLength));
}

namespace {

constexpr const char* kBlockSourcePath = "common/LibCallBlock";
constexpr const char* kReplySizeCheck = "outSize <= sizeof(outBuffer)";

void handOver(const KSTDataBlock& block, const std::uint8_t* bytes, std::size_t size) {
    block.invoke(block.captured, size > 0 ? bytes : nullptr, size);
}

KSTStatus getEnvironmentVariable(KSTTransport transport, void* transportContext,
                                 std::uint32_t variable, const KSTDataBlock& processVariable) {
    const kst::AssertionContext context = kst::libCallContext(kBlockSourcePath);
    KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(transport, "transport"),
                                           kst::Argument(processVariable, "processVariable"),
                                       });
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
    const kst::AssertionContext context = kst::libCallContext(kBlockSourcePath);
    KSTStatus err = kst::requireArguments(context, {kst::Argument(transport, "transport")});
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
        // No return yet: the block sees failed replies, too.
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
