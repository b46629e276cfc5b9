#include "KSTLib/KSTLib.h"

#include "KSTLib/Channel.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"

KSTStatus KSTSetEnvironmentVariable(std::uint32_t variable, const void* data,
                                    std::size_t dataLength) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             LibCall_KSTSetEnvironmentVariable(kst::channelTransport, nullptr,
                                                               variable, data, dataLength));
}

KSTStatus KSTGetEnvironmentVariable(std::uint32_t variable, KSTDataBlock processVariable) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             LibCall_KSTGetEnvironmentVariable_Block(kst::channelTransport, nullptr,
                                                                     variable, processVariable));
}

KSTStatus KSTKernelControl(std::uint32_t code, const void* data, std::size_t dataLength,
                           KSTDataBlock resultBlock) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             LibCall_KSTKernelControl_Block(kst::channelTransport, nullptr, code,
                                                            data, dataLength, resultBlock));
}
