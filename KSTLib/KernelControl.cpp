#include "KSTLib/Channel.h"
#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/LibraryLogging.h"

KSTStatus KSTKernelControl(std::uint32_t code, const void* data, std::size_t dataLength,
                           KSTDataBlock resultBlock) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    return kst::logReturning(__func__,
                             LibCall_KSTKernelControl_Block(kst::channelTransport, nullptr, code,
                                                            data, dataLength, resultBlock));
}
