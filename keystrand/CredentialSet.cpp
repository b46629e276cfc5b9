#include "keystrand/CredentialSet.h"

#include "base/ByteReader.h"
#include "wire/CredentialFields.h"

#include <algorithm>
#include <utility>

namespace keystrand {

namespace {

using Member = CredentialSet::Member;

bool areEqual(const KSTCredential& left, const KSTCredential& right) {
    std::uint8_t equal = 0;
    return CompareCredentials(&left, &right, &equal) == kKSTErrorSuccess && equal != 0;
}

auto isOfType(std::uint32_t type) {
    return [type](const Member& member) {
        return member.credential->type == type;
    };
}

auto isOfPurpose(KSTPassphrasePurpose purpose) {
    return [purpose](const Member& member) {
        return purposeOf(*member.credential) == purpose;
    };
}

auto isEqualTo(const KSTCredential& credential) {
    return [&credential](const Member& member) {
        return areEqual(*member.credential, credential);
    };
}

} // namespace

std::optional<KSTPassphrasePurpose> purposeOf(const KSTCredential& credential) {
    base::ByteReader reader(wire::credentialData(&credential));
    KSTPassphrasePurpose purpose = 0;
    if (credential.type != kKSTCredentialTypePassphraseEntered || !reader.readU32(purpose)) {
        return std::nullopt;
    }
    return purpose;
}

template <typename Superseded>
bool CredentialSet::addInPlaceOf(const Superseded& superseded, CredentialPointer credential,
                                 Seconds now) {
    if (members_.size() == kMaxCount &&
        std::none_of(members_.begin(), members_.end(), superseded)) {
        return false;
    }
    std::erase_if(members_, superseded);
    members_.push_back({std::move(credential), now});
    return true;
}

bool CredentialSet::add(CredentialPointer credential, Seconds now) {
    const auto superseded = isEqualTo(*credential);
    return addInPlaceOf(superseded, std::move(credential), now);
}

bool CredentialSet::replacePassphrases(CredentialPointer passphrase, Seconds now) {
    const auto purpose = purposeOf(*passphrase);
    return purpose && addInPlaceOf(isOfPurpose(*purpose), std::move(passphrase), now);
}

void CredentialSet::removeType(std::uint32_t type) {
    std::erase_if(members_, isOfType(type));
}

void CredentialSet::removeEqual(const KSTCredential& credential) {
    std::erase_if(members_, isEqualTo(credential));
}

void CredentialSet::removePassphrases(KSTPassphrasePurpose purpose) {
    std::erase_if(members_, isOfPurpose(purpose));
}

void CredentialSet::remove(const KSTCredential* member) {
    std::erase_if(members_,
                  [member](const Member& other) { return other.credential.get() == member; });
}

bool CredentialSet::containsType(std::uint32_t type) const {
    return std::any_of(members_.begin(), members_.end(), isOfType(type));
}

bool CredentialSet::containsPassphrase(KSTPassphrasePurpose purpose) const {
    return std::any_of(members_.begin(), members_.end(), isOfPurpose(purpose));
}

} // namespace keystrand
