#include "KSTLib/LibCall.h"

#include "KSTLib/Command.h"
#include "common/Allocation.h"
#include "common/CommandHeader.h"
#include "common/LibCallReport.h"
#include "common/NumberedPayload.h"
#include "common/RequiredFunction.h"

#include <cstring>
#include <limits>

namespace {

constexpr const char* kSourcePath = "common/LibCall";

KSTStatus setEnvironmentVariable(KSTTransport transport, void* transportContext,
                                 std::uint32_t variable, const void* data, std::size_t dataLength) {
    const kst::AssertionContext context = kst::libCallContext(kSourcePath);
    const KSTStatus missing = kst::requireFunction(context, transport, "transport");
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
