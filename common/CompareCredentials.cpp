#include "KSTLib/CredentialSerialization.h"
#include "KSTLib/Serialization.h"
#include "common/Allocation.h"
#include "common/CredentialTypes.h"
#include "common/Failure.h"

#include <algorithm>
#include <cstring>

namespace {

using Bytes = std::span<const std::uint8_t>;

/// Of the data area; of a shorter one only what is there.
struct Range {
    std::size_t offset;
    std::size_t length;

    [[nodiscard]] Bytes of(Bytes data) const {
        const std::size_t begin = std::min(offset, data.size());
        return data.subspan(begin, std::min(length, data.size() - begin));
    }
};

bool areEqual(Bytes a, Bytes b) {
    return CompareDataBlobs(a.data(), a.size(), b.data(), b.size()) != 0;
}

bool haveEqualHeaders(const KSTCredential* a, const KSTCredential* b) {
    return std::memcmp(a, b, sizeof(KSTCredential)) == 0;
}

bool haveEqualData(const KSTCredential* a, const KSTCredential* b, const Range& range) {
    return areEqual(range.of(kst::credentialData(a)), range.of(kst::credentialData(b)));
}

/// Everything about two passphrases but the headers. The lengths count as they are stored, also
/// those that no passphrase can have.
bool areEqualPassphrases(const KSTCredential* a, const KSTCredential* b) {
    using Data = KSTCredentialDataPassphraseEntered;
    return haveEqualData(a, b, {offsetof(Data, purpose), sizeof(Data::purpose)}) &&
           haveEqualData(a, b,
                         {offsetof(Data, passphraseLength), sizeof(Data::passphraseLength)}) &&
           haveEqualData(a, b, {offsetof(Data, passphrase), kst::passphraseLength(a)});
}

/// For two credentials of the same valid type and the same length.
bool areEqualOfOneType(const KSTCredential* a, const KSTCredential* b) {
    switch (a->type) {
    case kKSTCredentialTypePasscodeValidated:
        return haveEqualHeaders(a, b) && haveEqualData(a, b, {12, 16});
    case kKSTCredentialTypePassphraseEntered:
        return areEqualPassphrases(a, b);
    case kKSTCredentialTypeBiometryMatched:
        return haveEqualHeaders(a, b) && haveEqualData(a, b, {72, 16});
    case kKSTCredentialTypeUserOutputDisplayed:
        return haveEqualHeaders(a, b) && haveEqualData(a, b, {0, 32}) &&
               haveEqualData(a, b, {32, 24});
    case kKSTCredentialTypeContinuityUnlock:
        return haveEqualHeaders(a, b) && haveEqualData(a, b, {8, 16});
    case kKSTCredentialTypePasscodeValidated2:
        return haveEqualHeaders(a, b) && haveEqualData(a, b, {4, 16}) &&
               haveEqualData(a, b, {20, 16});
    default:
        return areEqual(kst::credentialBytes(a), kst::credentialBytes(b));
    }
}

} // namespace

std::uint8_t CompareDataBlobs(const void* data1, std::size_t length1, const void* data2,
                              std::size_t length2) noexcept {
    if (length1 != length2) {
        return 0;
    }
    if (data1 == nullptr || data2 == nullptr) {
        return data1 == data2 ? 1 : 0;
    }
    return std::memcmp(data1, data2, length1) == 0 ? 1 : 0;
}

KSTStatus CompareCredentials(const KSTCredential* credential1, const KSTCredential* credential2,
                             std::uint8_t* outEqual) noexcept {
    const kst::AssertionContext context = kst::serializationContext();
    const KSTStatus err =
        kst::requireArguments(context, {
                                           kst::Argument(credential1, "credential1"),
                                           kst::Argument(credential2, "credential2"),
                                           kst::Argument(outEqual, "equal"),
                                       });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (credential1->type != credential2->type ||
        credential1->dataLength != credential2->dataLength) {
        *outEqual = 0;
        return kKSTErrorSuccess;
    }
    if (kst::findCredentialType(credential1->type) == nullptr) {
        return kst::fail(context, "0", 0, kKSTErrorBadParameter);
    }
    *outEqual = areEqualOfOneType(credential1, credential2) ? 1 : 0;
    return kKSTErrorSuccess;
}

void DeallocDataBlob(void* data, std::size_t length) noexcept {
    kst::release(data, length);
}
