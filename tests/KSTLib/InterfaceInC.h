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
    /** Of the numbers that a block was handed beside the bytes. */
    uint32_t sum;
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

/** Puts a passphrase into a credential and hands it to `seen` from there. */
int32_t passphraseFromC(const void* passphrase, size_t length, struct Seen* seen);

/** Reads a list that is not empty and writes it again. Returns its size, or 0. */
size_t credentialListFromC(const void* bytes, size_t size, void* written, size_t room);

/** Reads a tree and walks the properties and the children of its root. */
int32_t walkRequirementFromC(const void* bytes, size_t size, struct Seen* properties,
                             struct Seen* children);

/** What a policy block written in C has seen. */
struct SeenPolicy {
    int calls;
    int32_t status;
    int satisfied;
    uint32_t requirementType;
};

/** Opens the context of `externalForm`, 16 bytes, adds a passphrase to it, asks it about a policy
 *  with a parameter in three ways and about a constraint, and deletes it without destroying it.
 *  Returns the first status that is not 0. */
int32_t contextFromC(const void* externalForm, struct Seen* form, struct SeenPolicy* policy);

/** Asks about a policy globally. */
void globalPolicyFromC(struct SeenPolicy* policy);

/** Has a list parsed. Returns the status, which `status` has seen too. */
int32_t parseAclFromC(const void* acl, size_t length, struct Seen* seen, int32_t* status);

/** Every public function under its name. */
struct NamedFunction {
    const char* name;
    void (*function)(void);
};
extern const struct NamedFunction kPublicFunctions[];
extern const size_t kPublicFunctionCount;

/** Sizes as C sees them. */
size_t sizeOfParameterInC(void);
size_t sizeOfPolicyBlocksInC(void);
size_t sizeOfDataBlockInC(void);
size_t sizeOfPropertyBlockInC(void);
size_t sizeOfCredentialInC(void);

int64_t allocatedBytesInC(void);

/** What C has for words: one function for each table. */
enum { kWordTableCount = 7 };
const char* wordsInC(int table, uint32_t number);
uint32_t credentialTypeForRequirementTypeInC(uint32_t type);

#ifdef __cplusplus
}
#endif

#endif
