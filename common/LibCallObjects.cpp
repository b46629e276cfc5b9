#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/LibCall.h"
#include "KSTLib/RequirementSerialization.h"
#include "common/Allocation.h"
#include "common/CredentialTypes.h"
#include "common/Failure.h"
#include "wire/CredentialFields.h"
#include "wire/RequirementLayout.h"

#include <cstring>
#include <string.h>

namespace {

using kst::CredentialProperty;
using PassphraseData = KSTCredentialDataPassphraseEntered;

constexpr std::uint32_t kNewCredentialWord4 = 1;

kst::AssertionContext assertionContext() {
    return kst::libCallContext("common/LibCall");
}

KSTStatus create(std::uint32_t type, KSTCredential** credential) {
    if (credential == nullptr) {
        return kst::fail(assertionContext(), "credential", 0, kKSTErrorBadParameter);
    }
    const kst::CredentialType* prescribed = kst::findCredentialType(type);
    if (prescribed == nullptr) {
        return kst::fail(assertionContext(), "0", 0, kKSTErrorBadParameter);
    }
    auto* created =
        static_cast<KSTCredential*>(kst::allocate(kst::credentialSize(prescribed->dataSize)));
    if (created == nullptr) {
        return kst::fail(assertionContext(), "cred", 0, kKSTErrorOutOfMemory);
    }
    created->type = type;
    created->word4 = kNewCredentialWord4;
    created->userId = kKSTCredentialNoUser;
    created->dataLength = prescribed->dataSize;
    *credential = created;
    return kKSTErrorSuccess;
}

/// Finds where a property is: its offset in the whole record.
KSTStatus locate(const KSTCredential* credential, const CredentialProperty* property,
                 std::size_t& offset) {
    if (property == nullptr) {
        return kst::fail(assertionContext(), "0", 0, kKSTErrorBadParameter);
    }
    if (property->isInHeader()) {
        offset = property->headerOffset;
        return kKSTErrorSuccess;
    }
    const wire::CredentialField* place = wire::findCredentialField(credential->type, property->id);
    if (place == nullptr) {
        return kst::fail(assertionContext(), property->typeCheck, 0, kKSTErrorBadParameter);
    }
    if (place->offset + property->length > credential->dataLength) {
        return kst::fail(assertionContext(), "offset + length <= credential->dataLength", 0,
                         kKSTErrorBadParameter);
    }
    offset = sizeof(KSTCredential) + place->offset;
    return kKSTErrorSuccess;
}

bool hasLength(const CredentialProperty& property, std::size_t length) {
    return property.id == kst::kPassphraseProperty ? length <= property.length
                                                   : length == property.length;
}

/// What belongs to a passphrase beside its `length` bytes, which are there already.
void finishPassphrase(std::uint8_t* data, std::size_t length) {
    const auto storedLength = static_cast<std::uint32_t>(length);
    std::memcpy(data + offsetof(PassphraseData, passphraseLength), &storedLength,
                sizeof storedLength);
    ::explicit_bzero(data + offsetof(PassphraseData, passphrase) + length,
                     kKSTPassphraseMaxLength - length);
}

KSTStatus setProperty(KSTCredential* credential, std::uint32_t propertyId, const void* data,
                      std::size_t dataLength) {
    const kst::AssertionContext context = assertionContext();
    if (credential == nullptr) {
        return kst::fail(context, "credential", 0, kKSTErrorBadParameter);
    }
    if ((data != nullptr) != (dataLength > 0)) {
        return kst::fail(context, "(data && dataLength) || (!data && !dataLength)", 0,
                         kKSTErrorBadParameter);
    }
    const CredentialProperty* property = kst::findCredentialProperty(propertyId);
    if (property != nullptr && property->lengthCheck == nullptr) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    std::size_t offset = 0;
    const KSTStatus err = locate(credential, property, offset);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // A null property was refused with the place. NOLINTNEXTLINE(clang-analyzer-core.*)
    if (!hasLength(*property, dataLength)) {
        return kst::fail(context, property->lengthCheck, 0, kKSTErrorBadParameter);
    }
    auto* record = reinterpret_cast<std::uint8_t*>(credential);
    if (dataLength > 0) {
        // The data may be the property itself.
        std::memmove(record + offset, data, dataLength);
    }
    if (propertyId == kst::kPassphraseProperty) {
        finishPassphrase(record + sizeof(KSTCredential), dataLength);
    }
    return kKSTErrorSuccess;
}

bool isZero(const std::uint8_t* bytes, std::size_t length) {
    return length == 0 || (bytes[0] == 0 && std::memcmp(bytes, bytes + 1, length - 1) == 0);
}

KSTStatus getPropertyData(const KSTCredential* credential, std::uint32_t propertyId,
                          const void** data, std::size_t* dataLength) {
    KSTStatus err =
        kst::requireArguments(assertionContext(), {
                                                      kst::Argument(credential, "credential"),
                                                      kst::Argument(data, "data"),
                                                      kst::Argument(dataLength, "dataLength"),
                                                  });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const CredentialProperty* property = kst::findCredentialProperty(propertyId);
    std::size_t offset = 0;
    err = locate(credential, property, offset);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const std::uint8_t* found = reinterpret_cast<const std::uint8_t*>(credential) + offset;
    if (propertyId == kst::kIdentifierProperty && isZero(found, property->length)) {
        *data = nullptr;
        *dataLength = 0;
        return kKSTErrorSuccess;
    }
    *data = found;
    *dataLength = propertyId == kst::kPassphraseProperty ? kst::passphraseLength(credential)
                                                         : property->length;
    return kKSTErrorSuccess;
}

} // namespace

KSTStatus LibCall_KSTCredentialCreate(std::uint32_t type, KSTCredential** credential) noexcept {
    return kst::printReturn(__func__, create(type, credential));
}

void LibCall_KSTCredentialDelete(KSTCredential* credential) noexcept {
    if (credential == nullptr) {
        static_cast<void>(kst::fail(assertionContext(), "credential", 0, kKSTErrorBadParameter));
        return;
    }
    DeallocCredential(credential);
}

std::uint32_t LibCall_KSTCredentialGetType(const KSTCredential* credential) noexcept {
    if (credential == nullptr) {
        static_cast<void>(kst::fail(assertionContext(), "credential", 0, kKSTErrorBadParameter));
        return 0;
    }
    return credential->type;
}

KSTStatus LibCall_KSTCredentialSetProperty(KSTCredential* credential, std::uint32_t propertyId,
                                           const void* data, std::size_t dataLength) noexcept {
    return kst::printReturn(__func__, setProperty(credential, propertyId, data, dataLength));
}

KSTStatus LibCall_KSTCredentialGetPropertyData(const KSTCredential* credential,
                                               std::uint32_t propertyId, const void** data,
                                               std::size_t* dataLength) noexcept {
    return kst::printReturn(__func__, getPropertyData(credential, propertyId, data, dataLength));
}

namespace {

/// A member of the header; 0 when there is none.
std::uint32_t headerWord(const KSTRequirement* requirement,
                         const std::uint32_t KSTRequirement::*word) {
    const KSTStatus err =
        kst::requireArguments(assertionContext(), {kst::Argument(requirement, "requirement")});
    return err == kKSTErrorSuccess ? requirement->*word : 0;
}

/// Finds the property of that number which the type of `requirement` has.
KSTStatus findProperty(const KSTRequirement* requirement, std::uint32_t propertyId,
                       const wire::RequirementProperty*& found) {
    const char* check = "0";
    for (const wire::RequirementProperty& property : wire::requirementProperties()) {
        if (property.id != propertyId) {
            continue;
        }
        if (property.belongsTo(requirement)) {
            found = &property;
            return kKSTErrorSuccess;
        }
        check = property.typeCheck;
    }
    return kst::fail(assertionContext(), check, 0, kKSTErrorBadParameter);
}

KSTStatus getPropertyData(const KSTRequirement* requirement, std::uint32_t propertyId,
                          const void** data, std::size_t* dataLength) {
    const kst::AssertionContext context = assertionContext();
    // The pointer and the length are one output to the check.
    KSTStatus err = kst::requireArguments(context, {
                                                       kst::Argument(requirement, "requirement"),
                                                       kst::Argument(data, "data"),
                                                       kst::Argument(dataLength, "data"),
                                                   });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const wire::RequirementProperty* property = nullptr;
    err = findProperty(requirement, propertyId, property);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // What is not found has a status. NOLINTNEXTLINE(clang-analyzer-core.*)
    if (!property->fitsIn(requirement)) {
        return kst::fail(context, "offset + length <= requirement->dataLength", 0,
                         kKSTErrorBadParameter);
    }
    *data = property->in(requirement);
    *dataLength = property->length;
    return kKSTErrorSuccess;
}

KSTStatus deleteRequirement(KSTTransport transport, KSTRequirement* requirement) {
    const KSTStatus err =
        kst::requireArguments(assertionContext(), {
                                                      kst::Argument(transport, "transport"),
                                                      kst::Argument(requirement, "requirement"),
                                                  });
    if (err == kKSTErrorSuccess) {
        DeallocRequirement(requirement);
    }
    return err;
}

} // namespace

std::uint32_t LibCall_KSTRequirementGetType(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::type);
}

std::uint32_t LibCall_KSTRequirementGetState(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::state);
}

std::uint32_t LibCall_KSTRequirementGetPriority(const KSTRequirement* requirement) noexcept {
    return headerWord(requirement, &KSTRequirement::priority);
}

KSTStatus LibCall_KSTRequirementGetPropertyData(const KSTRequirement* requirement,
                                                std::uint32_t propertyId, const void** data,
                                                std::size_t* dataLength) noexcept {
    return kst::printReturn(__func__, getPropertyData(requirement, propertyId, data, dataLength));
}

KSTStatus LibCall_KSTRequirementDelete(KSTTransport transport,
                                       KSTRequirement* requirement) noexcept {
    return kst::printReturn(__func__, deleteRequirement(transport, requirement));
}
