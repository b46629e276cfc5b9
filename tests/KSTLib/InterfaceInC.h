#ifndef TESTS_KSTLIB_INTERFACE_IN_C_H
#define TESTS_KSTLIB_INTERFACE_IN_C_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/** What a block written in C has seen. */
struct Seen {
    int calls;
    int wasNull;
    size_t length;
    unsigned char bytes[256];
};

/** Each calls one public function the way a C program does. */
int32_t kernelControlFromC(uint32_t code, const void* data, size_t length, struct Seen* seen);
int32_t kernelControlWithoutBlockFromC(uint32_t code);
int32_t setVariableFromC(uint32_t variable, const void* data, size_t length);
int32_t getVariableFromC(uint32_t variable, struct Seen* seen);
int32_t getVariableWithoutBlockFromC(uint32_t variable);

/** The LibCall functions with a transport written in C, which answers with `reply` and returns
 *  `status`; `seen` gets what the transport was handed. */
struct TransportInC {
    int32_t status;
    const void* reply;
    size_t replySize;
    uint32_t code;
    struct Seen seen;
};
int32_t libCallSetFromC(struct TransportInC* transport, const void* data, size_t length);
int32_t libCallGetFromC(struct TransportInC* transport, struct Seen* seen);
int32_t libCallControlFromC(struct TransportInC* transport, struct Seen* seen);

/** Builds a frame, copies it to `frame` and gives it back as its header says. Returns its size. */
size_t buildCommandFromC(uint8_t code, const void* payload, size_t size, unsigned char* frame);

/** Sizes as C sees them. */
size_t sizeOfDataBlockInC(void);

int64_t allocatedBytesInC(void);

#ifdef __cplusplus
}
#endif

#endif
