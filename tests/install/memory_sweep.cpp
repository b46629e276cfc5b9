// A client whose malloc can be told to fail. Each function that the library shows is called with
// each of its allocations failing, once and from there on, before and after the connection is
// open: its documented status, its outputs, nothing left behind, the next call works.
//
//   memory_sweep functions [JOURNAL]  JOURNAL: path of a journal socket to serve meanwhile
//   memory_sweep lengths              what a length that a message announces costs
//
// It is a client, so it knows the public headers alone.

#include "KSTLib/KSTLib.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/Serialization.h"
#include "failing_malloc.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <string>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

namespace {

constexpr KSTStatus kNoMemory = kKSTErrorOutOfMemory;
/// What a call gave that its documentation rules out.
constexpr KSTStatus kBroken = 4711;

constexpr std::uint8_t kHandle[16] = {1, 2, 3};
const char* const kPolicy = "unlock";
/// An access-control list as the model kernel takes it: one entry "o" with no constraint of note.
constexpr std::uint8_t kAcl[] = {1, 0, 0, 0};

/// What the calls are made with.
struct Subjects {
    KSTContextRef context = nullptr;
    KSTCredential* credential = nullptr;
    KSTRequirement* requirement = nullptr;
    KSTParameter parameter = {1, kHandle, 4};
    std::vector<std::uint8_t> credentialBytes, listBytes, addBytes, verifyBytes, constraintBytes,
        aclBytes, propertyBytes, requirementBytes;
};

Subjects subjects;

/// A transport that answers without the library's connection.
KSTStatus answer(void*, std::uint32_t code, std::uint32_t, const void*, std::size_t, void* out,
                 std::size_t* outSize) {
    if (out != nullptr) {
        std::memset(out, 0, *outSize);
    }
    if (outSize != nullptr) {
        *outSize = code == 1 ? 17 : code == 3 ? 4 + 16 : 0;
    }
    if (code == 3) {
        static_cast<std::uint8_t*>(out)[4] = 1;
    }
    return 0;
}

/// The status of a call whose output must be there on success and untouched otherwise.
template <typename Value>
KSTStatus checked(KSTStatus status, Value* output, Value* untouched) {
    const bool given = output != untouched;
    return given == (status == 0) && (!given || output != nullptr) ? status : kBroken;
}

template <typename Value, typename Make, typename Drop>
KSTStatus made(Make make, Drop drop) {
    static char place;
    auto* const untouched = reinterpret_cast<Value*>(&place);
    Value* output = untouched;
    const KSTStatus made = make(&output);
    const KSTStatus status = checked(made, output, untouched);
    if (status == 0) {
        drop(output);
    }
    return status;
}

/// Runs a call that tells its status by a block, which must be called exactly once.
template <typename Call>
KSTStatus toldOnce(Call call) {
    int calls = 0;
    KSTStatus told = kBroken;
    call([&](KSTStatus status, auto&&...) {
        ++calls;
        told = status;
    });
    return calls == 1 ? told : kBroken;
}

struct Function {
    const char* name;
    KSTStatus (*call)();
    /// A failed allocation may stay unnoticed: the deletion of a temporary context, which then goes
    /// alone.
    bool mayBeUnnoticed = false;
};

#define CALL(name, ...)                                                                            \
    {                                                                                              \
#name, []() -> KSTStatus {                                                                 \
            __VA_ARGS__                                                                            \
        }                                                                                          \
    }
#define CALL_GLOBALLY(name, ...)                                                                   \
    {                                                                                              \
#name, []() -> KSTStatus {                                                                 \
            __VA_ARGS__                                                                            \
        }, true                                                                                    \
    }

#define DESERIALIZED_CREDENTIAL(name)                                                              \
    CALL(name, KSTHandle handle; KSTScope scope = 0; return made<KSTCredential>(                   \
             [&](KSTCredential** out) {                                                            \
                 return name(subjects.addBytes.data(), subjects.addBytes.size(), &handle, out,     \
                             &scope);                                                              \
             },                                                                                    \
             DeallocCredential);)

const Function kFunctions[] = {
    CALL(KSTContextCreate, return made<struct KSTContext>(
                               [](KSTContextRef* out) { return KSTContextCreate(out); },
                               [](KSTContextRef context) { KSTContextDelete(context, false); });),
    CALL(
        KSTContextCreateWithExternalForm,
        KSTContextRef context = KSTContextCreateWithExternalForm(kHandle, sizeof kHandle);
        // No such context and a failure are both null; the log tells which.
        if (context != nullptr) { KSTContextDelete(context, false); } return orders.failed > 0
            ? kNoMemory
            : 0;),
    CALL(KSTContextDelete,
         return KSTContextDelete(subjects.context, true) == kNoMemory ? kNoMemory : 0;),
    CALL(KSTContextGetExternalForm, bool called = false; KSTContextGetExternalForm(
             subjects.context, [&](const void*, std::size_t) { called = true; });
         // The model does not know the handle.
         return called       ? kBroken
         : orders.failed > 0 ? kNoMemory
                             : 0;),
    CALL_GLOBALLY(KSTGlobalContextAddCredential,
                  return KSTGlobalContextAddCredential(subjects.credential);),
    CALL_GLOBALLY(KSTGlobalContextRemoveCredentialsByType,
                  return KSTGlobalContextRemoveCredentialsByType(2);),
    CALL_GLOBALLY(KSTGlobalContextVerifyPolicy, return toldOnce([](auto block) {
                      KSTGlobalContextVerifyPolicy(kPolicy, false, nullptr, 0, block);
                  });),
    CALL(KSTContextAddCredential,
         return KSTContextAddCredential(subjects.context, subjects.credential);),
    CALL(KSTContextAddCredentialWithScope,
         return KSTContextAddCredentialWithScope(nullptr, subjects.credential, kKSTScopeGlobal);),
    CALL(KSTContextRemoveCredentialsByType,
         return KSTContextRemoveCredentialsByType(subjects.context, 2);),
    CALL(KSTContextRemoveCredentialsByTypeAndScope,
         return KSTContextRemoveCredentialsByTypeAndScope(nullptr, 2, kKSTScopeGlobal);),
    CALL(KSTContextRemoveCredentialsByValue,
         return KSTContextRemoveCredentialsByValue(subjects.context, subjects.credential);),
    CALL(KSTContextRemoveCredentialsByValueAndScope,
         return KSTContextRemoveCredentialsByValueAndScope(nullptr, subjects.credential,
                                                           kKSTScopeGlobal);),
    CALL(KSTContextContainsCredentialType,
         return KSTContextContainsCredentialType(subjects.context, 2);),
    CALL(KSTContextContainsCredentialTypeEx,
         return KSTContextContainsCredentialTypeEx(subjects.context, 2, 1);),
    CALL(KSTContextContainsPassphraseCredentialWithPurpose,
         return KSTContextContainsPassphraseCredentialWithPurpose(subjects.context, 1, 1);),
    CALL(KSTContextRemovePassphraseCredentialsByPurposeAndScope,
         return KSTContextRemovePassphraseCredentialsByPurposeAndScope(nullptr, 1,
                                                                       kKSTScopeGlobal);),
    CALL(KSTContextReplacePassphraseCredentialsWithScope,
         return KSTContextReplacePassphraseCredentialsWithScope(nullptr, subjects.credential,
                                                                kKSTScopeGlobal);),
    CALL(KSTContextVerifyPolicy, int calls = 0;
         const KSTStatus status = KSTContextVerifyPolicy(
             subjects.context, kPolicy, [&](bool, const KSTRequirement*) { ++calls; });
         return calls == (status == 0 ? 1 : 0) ? status : kBroken;),
    CALL(KSTContextVerifyPolicyWithPreflight, int calls = 0;
         const KSTStatus status = KSTContextVerifyPolicyWithPreflight(
             subjects.context, kPolicy, true, [&](bool, const KSTRequirement*) { ++calls; });
         return calls == (status == 0 ? 1 : 0) ? status : kBroken;),
    CALL(KSTContextVerifyPolicyEx, return toldOnce([](auto block) {
             KSTContextVerifyPolicyEx(subjects.context, kPolicy, false, &subjects.parameter, 1, 0,
                                      block);
         });),
    CALL(KSTContextVerifyAclConstraint, return toldOnce([](auto block) {
             KSTContextVerifyAclConstraint(subjects.context, kAcl, sizeof kAcl, false, nullptr, 0,
                                           0, block);
         });),
    CALL(KSTParseAclAndCopyConstraintCharacteristics, KSTStatus returned = kBroken;
         const KSTStatus told = toldOnce([&](auto block) {
             returned = KSTParseAclAndCopyConstraintCharacteristics(kAcl, sizeof kAcl, block);
         });
         return told == returned ? told : kBroken;),
    CALL(KSTSetEnvironmentVariable, return KSTSetEnvironmentVariable(1, kHandle, 16);),
    CALL(KSTGetEnvironmentVariable, int calls = 0;
         const KSTStatus status =
             KSTGetEnvironmentVariable(1, [&](const void*, std::size_t) { ++calls; });
         return calls == (status == 0 ? 1 : 0) ? status : kBroken;),
    CALL(KSTKernelControl, std::size_t size = 9;
         const KSTStatus status =
             KSTKernelControl(5, "\1", 1, [&](const void*, std::size_t length) { size = length; });
         return size == (status == 0 ? 0U : 256U) ? status : kBroken;),
    CALL(KSTCredentialCreate,
         return made<KSTCredential>([](KSTCredential** out) { return KSTCredentialCreate(2, out); },
                                    KSTCredentialDelete);),
    CALL(KSTCredentialGetType,
         return KSTCredentialGetType(subjects.credential) == 2 ? 0 : kBroken;),
    CALL(KSTCredentialSetProperty,
         return KSTCredentialSetProperty(subjects.credential, 200, "open sesame", 11);),
    CALL(KSTCredentialGetPropertyData, const void* data = nullptr; std::size_t size = 0;
         return KSTCredentialGetPropertyData(subjects.credential, 200, &data, &size);),
    CALL(KSTCredentialGetProperty, return KSTCredentialGetProperty(
                                       subjects.credential, 200, [](const void*, std::size_t) {});),
    CALL(KSTRequirementGetType,
         return KSTRequirementGetType(subjects.requirement) == 4 ? 0 : kBroken;),
    CALL(KSTRequirementGetState, KSTRequirementGetState(subjects.requirement); return 0;),
    CALL(KSTRequirementGetPriority, KSTRequirementGetPriority(subjects.requirement); return 0;),
    CALL(KSTRequirementGetPropertyData, const void* data = nullptr; std::size_t size = 0;
         return KSTRequirementGetPropertyData(subjects.requirement, 1, &data, &size);),
    CALL(KSTRequirementGetProperty, return KSTRequirementGetProperty(
                                        subjects.requirement, 1, [](const void*, std::size_t) {});),
    CALL(KSTRequirementGetProperties,
         return KSTRequirementGetProperties(subjects.requirement,
                                            [](std::uint32_t, const void*, std::size_t) {});),
    CALL(KSTRequirementGetSubrequirements, int children = 0; KSTRequirementGetSubrequirements(
             subjects.requirement, [&](const KSTRequirement*) { ++children; });
         return children == 1 ? 0 : kBroken;),
    CALL(
        LibCall_BuildCommand, std::size_t size = 0;
        std::uint8_t* frame = LibCall_BuildCommand(1, 0, 0, kHandle, 16, &size);
        if (frame == nullptr) { return kNoMemory; } DeallocDataBlob(frame, size); return 0;),
    CALL(LibCall_KSTSetEnvironmentVariable,
         return LibCall_KSTSetEnvironmentVariable(answer, nullptr, 1, kHandle, 4);),
    CALL(LibCall_KSTGetEnvironmentVariable_Block,
         return LibCall_KSTGetEnvironmentVariable_Block(answer, nullptr, 1,
                                                        [](const void*, std::size_t) {});),
    CALL(LibCall_KSTKernelControl_Block,
         return LibCall_KSTKernelControl_Block(answer, nullptr, 1, nullptr, 0,
                                               [](const void*, std::size_t) {});),
    // Without memory the context is null, which is this function's way.
    CALL(
        LibCall_KSTContextCreate, KSTContextRef context = subjects.context;
        const KSTStatus status = LibCall_KSTContextCreate(answer, &context, nullptr);
        if (status == 0) {
            LibCall_KSTContextDelete(answer, context, true);
        } else if (context != nullptr) { return kBroken; } return status;),
    CALL(LibCall_KSTContexAddCredentialWithScope,
         return LibCall_KSTContexAddCredentialWithScope(answer, subjects.context,
                                                        subjects.credential, 1);),
    CALL(LibCall_KSTContexRemoveCredentialsByTypeAndScope,
         return LibCall_KSTContexRemoveCredentialsByTypeAndScope(answer, subjects.context, 2, 1);),
    CALL(
        LibCall_KSTContextVerifyPolicyAndCopyRequirementEx, bool satisfied = false;
        KSTRequirement* requirement = nullptr;
        const KSTStatus status = LibCall_KSTContextVerifyPolicyAndCopyRequirementEx(
            answer, subjects.context, kPolicy, false, &subjects.parameter, 1, 0, &satisfied,
            &requirement);
        if (status != 0) {
            return requirement == nullptr ? status : kBroken;
        } return LibCall_KSTRequirementDelete(answer, requirement);),
    CALL(LibCall_KSTCredentialCreate,
         return made<KSTCredential>(
             [](KSTCredential** out) { return LibCall_KSTCredentialCreate(2, out); },
             LibCall_KSTCredentialDelete);),
    CALL(LibCall_KSTCredentialGetType,
         return LibCall_KSTCredentialGetType(subjects.credential) == 2 ? 0 : kBroken;),
    CALL(LibCall_KSTCredentialSetProperty,
         return LibCall_KSTCredentialSetProperty(subjects.credential, 200, "open sesame", 11);),
    CALL(LibCall_KSTCredentialGetPropertyData, const void* data = nullptr; std::size_t size = 0;
         return LibCall_KSTCredentialGetPropertyData(subjects.credential, 200, &data, &size);),
    CALL(LibCall_KSTRequirementGetType,
         return LibCall_KSTRequirementGetType(subjects.requirement) == 4 ? 0 : kBroken;),
    CALL(LibCall_KSTRequirementGetState, LibCall_KSTRequirementGetState(subjects.requirement);
         return 0;),
    CALL(LibCall_KSTRequirementGetPriority, LibCall_KSTRequirementGetPriority(subjects.requirement);
         return 0;),
    CALL(LibCall_KSTRequirementGetPropertyData, const void* data = nullptr; std::size_t size = 0;
         return LibCall_KSTRequirementGetPropertyData(subjects.requirement, 1, &data, &size);),
    CALL(CopyCredential,
         return made<KSTCredential>(
             [](KSTCredential** out) { return CopyCredential(subjects.credential, out); },
             DeallocCredential);),
    CALL(CompareCredentials, std::uint8_t equal = 0;
         const KSTStatus status =
             CompareCredentials(subjects.credential, subjects.credential, &equal);
         return equal == 1 ? status : kBroken;),
    CALL(CompareDataBlobs, return CompareDataBlobs(kHandle, 16, kHandle, 16) == 1 ? 0 : kBroken;),
    CALL(DeserializeCredential, std::size_t consumed = 0; return made<KSTCredential>(
             [&](KSTCredential** out) {
                 return DeserializeCredential(subjects.credentialBytes.data(),
                                              subjects.credentialBytes.size(), out, &consumed);
             },
             DeallocCredential);),
    CALL(DeserializeCredentialList, std::uint32_t count = 0; return made<KSTCredential*>(
             [&](KSTCredential*** out) {
                 return DeserializeCredentialList(subjects.listBytes.data(),
                                                  subjects.listBytes.size(), out, &count);
             },
             [&](KSTCredential** list) { DeallocCredentialList(list, count); });),
    DESERIALIZED_CREDENTIAL(DeserializeAddCredential),
    DESERIALIZED_CREDENTIAL(DeserializeRemoveCredential),
    DESERIALIZED_CREDENTIAL(DeserializeReplacePassphraseCredential),
    CALL(DeserializeGetContextProperty, KSTHandle handle; KSTContextProperty property = 0;
         return DeserializeGetContextProperty(subjects.propertyBytes.data(),
                                              subjects.propertyBytes.size(), &handle, &property);),
    CALL(DeserializeRequirement, std::size_t consumed = 0; return made<KSTRequirement>(
             [&](KSTRequirement** out) {
                 return DeserializeRequirement(subjects.requirementBytes.data(),
                                               subjects.requirementBytes.size(), out, &consumed);
             },
             DeallocRequirement);),
    CALL(
        DeserializeVerifyPolicy, KSTHandle handle; char* policy = nullptr;
        std::uint8_t preflight = 0; std::uint32_t age = 0; std::uint32_t count = 0;
        KSTParameter* parameters = nullptr;
        const KSTStatus status =
            DeserializeVerifyPolicy(subjects.verifyBytes.data(), subjects.verifyBytes.size(),
                                    &handle, &policy, &preflight, &age, &parameters, &count);
        if (status != 0) {
            return policy == nullptr && parameters == nullptr ? status : kBroken;
        } DeallocDataBlob(policy, std::strlen(policy) + 1);
        DeallocParameters(parameters, count); return 0;),
    CALL(
        DeserializeVerifyAclConstraint, KSTHandle handle; void* constraint = nullptr;
        std::uint32_t length = 0; std::uint8_t preflight = 0; std::uint32_t age = 0;
        std::uint32_t count = 0; KSTParameter* parameters = nullptr;
        const KSTStatus status = DeserializeVerifyAclConstraint(
            subjects.constraintBytes.data(),
            static_cast<std::uint32_t>(subjects.constraintBytes.size()), &handle, &constraint,
            &length, &preflight, &age, &parameters, &count);
        if (status != 0) {
            return constraint == nullptr && parameters == nullptr ? status : kBroken;
        } DeallocDataBlob(constraint, length);
        DeallocParameters(parameters, count); return 0;),
    CALL(
        DeserializeProcessAcl, KSTHandle handle; void* acl = nullptr; void* operation = nullptr;
        std::uint32_t aclLength = 0; std::uint32_t operationLength = 0; std::uint32_t age = 0;
        std::uint32_t count = 0; KSTParameter* parameters = nullptr;
        const KSTStatus status = DeserializeProcessAcl(
            subjects.aclBytes.data(), static_cast<std::uint32_t>(subjects.aclBytes.size()), &handle,
            &acl, &aclLength, &operation, &operationLength, &age, &parameters, &count);
        if (status != 0) {
            return acl == nullptr && operation == nullptr && parameters == nullptr ? status
                                                                                   : kBroken;
        } DeallocDataBlob(acl, aclLength);
        DeallocDataBlob(operation, operationLength); DeallocParameters(parameters, count);
        return 0;),
};

/// Functions that these call in passing, or that prepare what they are called with.
constexpr const char* kCalledInPassing[] = {"DeallocCredential",
                                            "DeallocCredentialList",
                                            "DeallocDataBlob",
                                            "DeallocParameters",
                                            "DeallocRequirement",
                                            "GetSerializedAddCredentialSize",
                                            "GetSerializedCredentialSize",
                                            "GetSerializedGetContextPropertySize",
                                            "GetSerializedParametersLength",
                                            "GetSerializedProcessAclSize",
                                            "GetSerializedRemoveCredentialSize",
                                            "GetSerializedReplacePassphraseCredentialSize",
                                            "GetSerializedRequirementSize",
                                            "GetSerializedVerifyAclConstraintSize",
                                            "GetSerializedVerifyPolicySize",
                                            "KSTCredentialDelete",
                                            "LibCall_KSTContextDelete",
                                            "LibCall_KSTCredentialDelete",
                                            "LibCall_KSTRequirementDelete",
                                            "SerializeAddCredential",
                                            "SerializeCredential",
                                            "SerializeCredentialList",
                                            "SerializeGetContextProperty",
                                            "SerializeProcessAcl",
                                            "SerializeRemoveCredential",
                                            "SerializeReplacePassphraseCredential",
                                            "SerializeRequirement",
                                            "SerializeVerifyAclConstraint",
                                            "SerializeVerifyPolicy",
                                            "ValidateParameter",
                                            "gAllocatedBytes",
                                            "gLastAllocatedBytes"};

int failures = 0;

void fail(const std::string& what) {
    std::fprintf(stderr, "not ok - %s\n", what.c_str());
    ++failures;
}

template <typename Size, typename Measure, typename Write>
std::vector<std::uint8_t> serialized(Measure measure, Write write) {
    Size size = 0;
    if (measure(&size) != 0) {
        std::abort();
    }
    std::vector<std::uint8_t> bytes(size);
    if (write(bytes.data(), &size) != 0) {
        std::abort();
    }
    bytes.resize(size);
    return bytes;
}

/// Calls every function of the second list with every allocation refused; none needs any.
void prepareSubjects() {
    Subjects& s = subjects;
    std::uint8_t leafInAnd[16 + 4 + 16] = {4};
    leafInAnd[12] = 12;
    leafInAnd[16] = 1;
    leafInAnd[20] = 1;
    s.requirementBytes.assign(leafInAnd, leafInAnd + sizeof leafInAnd);
    std::size_t consumed = 0;
    const bool isMade = KSTCredentialCreate(2, &s.credential) == 0 &&
                        KSTCredentialSetProperty(s.credential, 200, "open sesame", 11) == 0 &&
                        LibCall_KSTContextCreate(answer, &s.context, nullptr) == 0 &&
                        DeserializeRequirement(s.requirementBytes.data(), sizeof leafInAnd,
                                               &s.requirement, &consumed) == 0;
    if (!isMade) {
        std::abort();
    }
    KSTHandle handle;
    std::memcpy(handle.bytes, kHandle, sizeof handle.bytes);
    s.credentialBytes = serialized<std::size_t>(
        [&](auto* size) { return GetSerializedCredentialSize(s.credential, size); },
        [&](auto* out, auto* size) { return SerializeCredential(s.credential, out, size); });
    KSTCredential* const list[] = {s.credential, s.credential};
    s.listBytes.resize(1000);
    std::size_t listSize = s.listBytes.size();
    if (SerializeCredentialList(list, 2, s.listBytes.data(), &listSize) != 0) {
        std::abort();
    }
    s.listBytes.resize(listSize);
    s.addBytes = serialized<std::size_t>(
        [&](auto* size) { return GetSerializedAddCredentialSize(&handle, s.credential, 1, size); },
        [&](auto* out, auto* size) {
            return SerializeAddCredential(&handle, s.credential, 1, out, size);
        });
    s.propertyBytes = serialized<std::size_t>(
        [&](auto* size) { return GetSerializedGetContextPropertySize(&handle, 1, size); },
        [&](auto* out, auto* size) { return SerializeGetContextProperty(&handle, 1, out, size); });
    s.verifyBytes = serialized<std::size_t>(
        [&](auto* size) {
            return GetSerializedVerifyPolicySize(&handle, kPolicy, 0, 0, &s.parameter, 1, size);
        },
        [&](auto* out, auto* size) {
            return SerializeVerifyPolicy(&handle, kPolicy, 0, 0, &s.parameter, 1, out, size);
        });
    s.constraintBytes = serialized<std::uint32_t>(
        [&](auto* size) {
            return GetSerializedVerifyAclConstraintSize(&handle, "c", 1, 0, 0, &s.parameter, 1,
                                                        size);
        },
        [&](auto* out, auto* size) {
            return SerializeVerifyAclConstraint(&handle, "c", 1, 0, 0, &s.parameter, 1, out, size);
        });
    s.aclBytes = serialized<std::uint32_t>(
        [&](auto* size) {
            return GetSerializedProcessAclSize(&handle, "acl", 3, "op", 2, 0, &s.parameter, 1,
                                               size);
        },
        [&](auto* out, auto* size) {
            return SerializeProcessAcl(&handle, "acl", 3, "op", 2, 0, &s.parameter, 1, out, size);
        });
}

/// That nothing which only measures, checks, writes or releases needs memory.
void checkThoseThatAllocateNothing() {
    const Subjects wanted = std::move(subjects);
    subjects = Subjects{};
    orders = Orders{};
    // Making the subjects allocates, writing them does not: the vectors are the program's own.
    prepareSubjects();
    const Subjects again = std::exchange(subjects, wanted);
    if (again.addBytes != subjects.addBytes || again.verifyBytes != subjects.verifyBytes) {
        fail("the same is written twice");
    }
    std::vector<std::uint8_t> out(1000);
    KSTHandle handle = {};
    std::size_t size = 0;
    std::uint32_t size32 = 0;
    orders = {true, true, 0, 0, 0, 0};
    KSTStatus err = ValidateParameter(&subjects.parameter);
    err |= GetSerializedParametersLength(&subjects.parameter, 1, &size32);
    err |= GetSerializedRequirementSize(subjects.requirement, &size);
    err |= SerializeRequirement(subjects.requirement, out.data(), &(size = out.size()));
    err |= GetSerializedCredentialSize(subjects.credential, &size);
    err |= SerializeCredential(subjects.credential, out.data(), &(size = out.size()));
    err |= SerializeCredentialList(&subjects.credential, 1, out.data(), &(size = out.size()));
    err |= GetSerializedAddCredentialSize(&handle, subjects.credential, 1, &size);
    err |=
        SerializeAddCredential(&handle, subjects.credential, 1, out.data(), &(size = out.size()));
    err |= GetSerializedRemoveCredentialSize(&handle, subjects.credential, 1, &size);
    err |= SerializeRemoveCredential(&handle, subjects.credential, 1, out.data(),
                                     &(size = out.size()));
    err |= GetSerializedReplacePassphraseCredentialSize(&handle, subjects.credential, 1, &size);
    err |= SerializeReplacePassphraseCredential(&handle, subjects.credential, 1, out.data(),
                                                &(size = out.size()));
    err |= SerializeGetContextProperty(&handle, 1, out.data(), &(size = out.size()));
    err |=
        SerializeVerifyPolicy(&handle, kPolicy, 0, 0, nullptr, 0, out.data(), &(size = out.size()));
    err |= SerializeVerifyAclConstraint(&handle, "c", 1, 0, 0, nullptr, 0, out.data(),
                                        &(size32 = 1000));
    err |=
        SerializeProcessAcl(&handle, "a", 1, "o", 1, 0, nullptr, 0, out.data(), &(size32 = 1000));
    const std::size_t asked = orders.asked;
    orders = Orders{};
    if (err != 0 || asked != 0) {
        fail("what only measures and writes needs no memory");
    }
    KSTCredentialDelete(again.credential);
    LibCall_KSTContextDelete(answer, again.context, false);
    DeallocRequirement(again.requirement);
}

/// One call with one failing allocation, in a process of its own. Ends with 0 when all is as it
/// should be, 1 when no allocation was left to fail, 2 otherwise.
[[noreturn]] void tryOnce(const Function& function, std::size_t failing, bool fromThereOn,
                          bool open, KSTStatus usual) {
    failures = 0;
    if (open && KSTSetEnvironmentVariable(9, "x", 1) != 0) {
        fail("the connection opens");
        ::_exit(2);
    }
    orders = {true, fromThereOn, failing, 0, 0, 0};
    const KSTStatus status = function.call();
    const Orders after = std::exchange(orders, Orders{});
    const std::string what = std::string(function.name) + (open ? ", open" : ", not open") +
                             ", allocation " + std::to_string(failing) +
                             (fromThereOn ? " and on" : "");
    if (after.live != 0 && std::strcmp(function.name, "KSTContextDelete") != 0) {
        fail(what + ": " + std::to_string(after.live) + " blocks left");
    }
    const bool isUsual = after.failed == 0 || function.mayBeUnnoticed;
    if (status != kNoMemory && !(isUsual && status == usual)) {
        fail(what + ": status " + std::to_string(status));
    }
    if (after.failed == 0 && status == kNoMemory) {
        fail(what + ": no allocation failed");
    }
    // A deleted context is gone; any other subject is as it was.
    const bool isGone = std::strcmp(function.name, "KSTContextDelete") == 0 && status != kNoMemory;
    if (!isGone && function.call() != usual) {
        fail(what + ": the next call");
    }
    std::fflush(nullptr);
    ::_exit(failures != 0 ? 2 : after.failed == 0 ? 1 : 0);
}

int sweepFunctions() {
    prepareSubjects();
    checkThoseThatAllocateNothing();
    std::size_t cases = 0;
    for (const Function& function : kFunctions) {
        KSTStatus usual = 0;
        // What the model kernel says without any failure, which may be a status of its own.
        int statusPipe[2];
        if (::pipe(statusPipe) != 0) {
            return 1;
        }
        inChild([&] {
            const KSTStatus status = function.call();
            static_cast<void>(!::write(statusPipe[1], &status, sizeof status));
        });
        ::close(statusPipe[1]);
        if (::read(statusPipe[0], &usual, sizeof usual) != sizeof usual || usual == kBroken ||
            (usual < 0 && usual > -5095)) {
            if (usual != kKSTErrorNotContained) {
                fail(std::string(function.name) + ": usual status " + std::to_string(usual));
            }
        }
        ::close(statusPipe[0]);
        for (const bool open : {false, true}) {
            for (const bool fromThereOn : {false, true}) {
                int ended = 0;
                for (std::size_t failing = 0; ended == 0; ++failing, ++cases) {
                    ended = inChild([&] { tryOnce(function, failing, fromThereOn, open, usual); });
                }
                if (ended > 1) {
                    fail(std::string(function.name) + (ended == 3 ? ": killed" : ""));
                }
            }
        }
    }
    std::fprintf(stderr, "%zu cases\n", cases);
    return failures == 0 ? 0 : 1;
}

/// Serves a journal socket: reads whatever comes, so that writers do not wait.
void serveJournal(const char* path, std::atomic<std::size_t>& lines) {
    const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path, sizeof address.sun_path - 1);
    if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        std::perror(path);
        std::abort();
    }
    std::thread([socket, &lines] {
        char line[1 << 16];
        while (::recv(socket, line, sizeof line, 0) > 0) {
            ++lines;
        }
    }).detach();
}

long pageFaults() {
    rusage usage{};
    ::getrusage(RUSAGE_SELF, &usage);
    return usage.ru_minflt;
}

/// A message of 20 bytes: the handle, then a length that nothing stands behind.
KSTStatus readAnnouncement(std::uint32_t length) {
    std::uint8_t message[20] = {};
    std::memcpy(message + 16, &length, sizeof length);
    KSTHandle handle;
    void* constraint = nullptr;
    std::uint32_t constraintLength = 0;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    KSTParameter* parameters = nullptr;
    std::uint32_t count = 0;
    return DeserializeVerifyAclConstraint(message, sizeof message, &handle, &constraint,
                                          &constraintLength, &preflight, &age, &parameters, &count);
}

/// A length costs as little the tenth time as the first. The allocator changes where it takes large
/// blocks from once it got one back, and would clear what it has had before.
void measureLength(std::uint32_t length) {
    const long before = pageFaults();
    for (int round = 0; round < 10; ++round) {
        const KSTStatus status = readAnnouncement(length);
        if (status != kKSTErrorBadParameter && status != kNoMemory) {
            fail("length " + std::to_string(length) + ": status " + std::to_string(status));
        }
    }
    const long faults = pageFaults() - before;
    // The allocator writes down where its blocks are.
    if (faults > 20) {
        fail("length " + std::to_string(length) + ": " + std::to_string(faults) + " page faults");
    }
}

int measureLengths() {
    static_cast<void>(readAnnouncement(1));
    constexpr std::uint32_t kLengths[] = {4096,       16384,      65536,      131072,
                                          262144,     1U << 20U,  4U << 20U,  16U << 20U,
                                          31U << 20U, 32U << 20U, 33U << 20U, 64U << 20U};
    for (const std::uint32_t length : kLengths) {
        for (const std::uint32_t announced : {length - 1, length, length + 1}) {
            measureLength(announced);
        }
    }
    measureLength(UINT32_MAX);
    return failures == 0 ? 0 : 1;
}

/// Every name that the library shows is in one of the lists.
int listNames() {
    for (const Function& function : kFunctions) {
        std::puts(function.name);
    }
    for (const char* name : kCalledInPassing) {
        std::puts(name);
    }
    return 0;
}

} // namespace

int main(int argc, char** argv) {
    const std::string what = argc > 1 ? argv[1] : "";
    if (what == "names") {
        return listNames();
    }
    // Standard output takes its buffer now.
    std::printf("begin\n");
    std::fflush(stdout);
    std::atomic<std::size_t> lines = 0;
    if (what == "functions") {
        if (argc > 2) {
            serveJournal(argv[2], lines);
        }
        const int ended = sweepFunctions();
        if (argc > 2 && lines == 0) {
            fail("the journal got lines");
        }
        return ended != 0 || failures != 0 ? 1 : 0;
    }
    return what == "lengths" ? measureLengths() : 2;
}
