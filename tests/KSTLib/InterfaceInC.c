#include "tests/KSTLib/InterfaceInC.h"

#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "KSTLib/Words.h"

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
    return KSTKernelControl(code, NULL, 0, KST_NO_BLOCK);
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
    DeallocDataBlob(built, frameSize);
    return frameSize;
}

int32_t passphraseFromC(const void* passphrase, size_t length, struct Seen* seen) {
    KSTCredential* credential = NULL;
    int32_t err = KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = KSTCredentialSetProperty(credential, 200, passphrase, length);
    if (err == kKSTErrorSuccess) {
        const KSTDataBlock block = {keep, seen};
        err = KSTCredentialGetProperty(credential, 200, block);
    }
    KSTCredentialDelete(credential);
    return err;
}

size_t credentialListFromC(const void* bytes, size_t size, void* written, size_t room) {
    KSTCredential** list = NULL;
    uint32_t count = 0;
    if (DeserializeCredentialList(bytes, size, &list, &count) != kKSTErrorSuccess) {
        return 0;
    }
    if (SerializeCredentialList(list, count, written, &room) != kKSTErrorSuccess) {
        room = 0;
    }
    DeallocCredentialList(list, count);
    return room;
}

static void keepProperty(void* captured, uint32_t propertyId, const void* data, size_t length) {
    struct Seen* seen = captured;
    keep(seen, data, length);
    seen->sum += propertyId;
}

static void addType(void* captured, const KSTRequirement* requirement) {
    struct Seen* seen = captured;
    ++seen->calls;
    seen->sum += KSTRequirementGetType(requirement);
}

int32_t walkRequirementFromC(const void* bytes, size_t size, struct Seen* properties,
                             struct Seen* children) {
    KSTRequirement* tree = NULL;
    size_t consumed = 0;
    int32_t err = DeserializeRequirement(bytes, size, &tree, &consumed);
    if (err == kKSTErrorSuccess) {
        err = KSTRequirementGetProperties(tree, (KSTPropertyBlock){keepProperty, properties});
        KSTRequirementGetSubrequirements(tree, (KSTRequirementBlock){addType, children});
        if (KSTRequirementGetSubrequirementsCount(tree) != (size_t)children->calls) {
            err = kKSTErrorUnexpected;
        }
        DeallocRequirement(tree);
    }
    return err;
}

static void keepStatusAndPolicy(void* captured, KSTStatus status, bool policySatisfied,
                                const KSTRequirement* requirement) {
    struct SeenPolicy* seen = captured;
    ++seen->calls;
    seen->status = status;
    seen->satisfied = policySatisfied;
    seen->requirementType = requirement != NULL ? requirement->type : 0;
}

static void keepPolicy(void* captured, bool policySatisfied, const KSTRequirement* requirement) {
    keepStatusAndPolicy(captured, kKSTErrorSuccess, policySatisfied, requirement);
}

static int32_t askFromC(KSTContextRef context, struct SeenPolicy* policy) {
    const KSTPolicyBlock block = {keepPolicy, policy};
    const KSTPolicyStatusBlock statusBlock = {keepStatusAndPolicy, policy};
    const KSTParameter parameters[] = {{3, "value", 5}};
    int32_t err = KSTContextVerifyPolicy(context, "policy", block);
    if (err == kKSTErrorSuccess) {
        err = KSTContextVerifyPolicyWithPreflight(context, "policy", true, block);
    }
    if (err == kKSTErrorSuccess) {
        KSTContextVerifyPolicyEx(context, "policy", false, parameters, 1, 60, statusBlock);
        KSTContextVerifyAclConstraint(context, "constraint", 10, false, NULL, 0, 60, statusBlock);
        err = policy->status;
    }
    return err;
}

int32_t contextFromC(const void* externalForm, struct Seen* form, struct SeenPolicy* policy) {
    KSTContextRef context = KSTContextCreateWithExternalForm(externalForm, sizeof(KSTHandle));
    if (context == NULL) {
        return kKSTErrorUnexpected;
    }
    KSTContextGetExternalForm(context, (KSTDataBlock){keep, form});
    KSTCredential* credential = NULL;
    int32_t err = KSTCredentialCreate(kKSTCredentialTypePassphraseEntered, &credential);
    if (err == kKSTErrorSuccess) {
        err = KSTContextAddCredential(context, credential);
        KSTCredentialDelete(credential);
    }
    if (err == kKSTErrorSuccess) {
        err = askFromC(context, policy);
    }
    const int32_t deleted = KSTContextDelete(context, false);
    return err != kKSTErrorSuccess ? err : deleted;
}

void globalPolicyFromC(struct SeenPolicy* policy) {
    const KSTPolicyStatusBlock block = {keepStatusAndPolicy, policy};
    KSTGlobalContextVerifyPolicy("policy", false, NULL, 0, block);
}

struct SeenStatus {
    struct Seen* seen;
    int32_t* status;
};

static void keepStatusAndData(void* captured, KSTStatus status, const void* data, size_t length) {
    const struct SeenStatus* seen = captured;
    keep(seen->seen, data, length);
    *seen->status = status;
}

int32_t parseAclFromC(const void* acl, size_t length, struct Seen* seen, int32_t* status) {
    struct SeenStatus captured = {seen, status};
    const KSTStatusDataBlock block = {keepStatusAndData, &captured};
    return KSTParseAclAndCopyConstraintCharacteristics(acl, length, block);
}

size_t sizeOfParameterInC(void) {
    return sizeof(KSTParameter);
}

size_t sizeOfPolicyBlocksInC(void) {
    return sizeof(KSTPolicyBlock) + sizeof(KSTPolicyStatusBlock) + sizeof(KSTStatusDataBlock);
}

size_t sizeOfDataBlockInC(void) {
    return sizeof(KSTDataBlock);
}

size_t sizeOfPropertyBlockInC(void) {
    return sizeof(KSTPropertyBlock);
}

size_t sizeOfCredentialInC(void) {
    return sizeof(KSTCredential) + sizeof(KSTCredentialDataBiometryMatched);
}

int64_t allocatedBytesInC(void) {
    return gAllocatedBytes + gLastAllocatedBytes;
}

const char* wordsInC(int table, uint32_t number) {
    switch (table) {
    case 0:
        return KSTStatusText((KSTStatus)number);
    case 1:
        return KSTCredentialPropertyText(number);
    case 2:
        return KSTRequirementPropertyText(number);
    case 3:
        return KSTPassphrasePurposeText(number);
    case 4:
        return KSTRequirementStateText(number);
    case 5:
        return KSTRequirementTypeText(number);
    default:
        return KSTParameterTypeText(number);
    }
}

uint32_t credentialTypeForRequirementTypeInC(uint32_t type) {
    return KSTCredentialTypeForRequirementType(type);
}
