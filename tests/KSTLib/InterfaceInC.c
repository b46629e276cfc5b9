#include "tests/KSTLib/InterfaceInC.h"

#include "KSTLib/KSTLib.h"

#include <stdlib.h>
#include <string.h>

static void keep(void* captured, const void* data, size_t length) {
    struct Seen* seen = captured;
    ++seen->calls;
    seen->wasNull = data == NULL;
    seen->length = length;
    if (data != NULL && length <= sizeof seen->bytes) {
        memcpy(seen->bytes, data, length);
    }
}

static KSTStatus transportInC(void* context, uint32_t code, uint32_t thirdByte, const void* inData,
                              size_t inSize, void* outData, size_t* outSize) {
    struct TransportInC* transport = context;
    transport->code = code + thirdByte;
    keep(&transport->seen, inData, inSize);
    if (outSize != NULL && transport->replySize <= *outSize) {
        memcpy(outData, transport->reply, transport->replySize);
        *outSize = transport->replySize;
    }
    return transport->status;
}

int32_t kernelControlFromC(uint32_t code, const void* data, size_t length, struct Seen* seen) {
    const KSTDataBlock block = {keep, seen};
    return KSTKernelControl(code, data, length, block);
}

int32_t kernelControlWithoutBlockFromC(uint32_t code) {
    const KSTDataBlock block = {NULL, NULL};
    return KSTKernelControl(code, NULL, 0, block);
}

int32_t setVariableFromC(uint32_t variable, const void* data, size_t length) {
    return KSTSetEnvironmentVariable(variable, data, length);
}

int32_t getVariableFromC(uint32_t variable, struct Seen* seen) {
    return KSTGetEnvironmentVariable(variable, (KSTDataBlock){.invoke = keep, .captured = seen});
}

int32_t getVariableWithoutBlockFromC(uint32_t variable) {
    return KSTGetEnvironmentVariable(variable, (KSTDataBlock){0});
}

int32_t libCallSetFromC(struct TransportInC* transport, const void* data, size_t length) {
    return LibCall_KSTSetEnvironmentVariable(transportInC, transport, 1, data, length);
}

int32_t libCallGetFromC(struct TransportInC* transport, struct Seen* seen) {
    const KSTDataBlock block = {keep, seen};
    return LibCall_KSTGetEnvironmentVariable_Block(transportInC, transport, 1, block);
}

int32_t libCallControlFromC(struct TransportInC* transport, struct Seen* seen) {
    const KSTDataBlock block = {keep, seen};
    return LibCall_KSTKernelControl_Block(transportInC, transport, 1, NULL, 0, block);
}

size_t buildCommandFromC(uint8_t code, const void* payload, size_t size, unsigned char* frame) {
    size_t frameSize = 0;
    uint8_t* built = LibCall_BuildCommand(code, 0, 0, payload, size, &frameSize);
    if (built == NULL) {
        return 0;
    }
    memcpy(frame, built, frameSize);
    memset(built, 0, frameSize);
    free(built);
    gAllocatedBytes -= (int64_t)frameSize;
    return frameSize;
}

size_t sizeOfDataBlockInC(void) {
    return sizeof(KSTDataBlock);
}

int64_t allocatedBytesInC(void) {
    return gAllocatedBytes + gLastAllocatedBytes;
}
