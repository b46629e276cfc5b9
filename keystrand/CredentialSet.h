#pragma once

#include "KSTLib/CredentialSerialization.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

namespace keystrand {

/// Wipes a credential when it goes.
struct CredentialRelease {
    void operator()(KSTCredential* credential) const { DeallocCredential(credential); }
};
using CredentialPointer = std::unique_ptr<KSTCredential, CredentialRelease>;

/// None for a credential that is no passphrase.
[[nodiscard]] std::optional<KSTPassphrasePurpose> purposeOf(const KSTCredential& credential);

/// The credentials of one context, or those of all clients, the oldest first. No two are equal in
/// the sense of CompareCredentials. What is taken out is wiped.
class CredentialSet {
  public:
    static constexpr std::size_t kMaxCount = 64;
    using Seconds = std::uint64_t;

    struct Member {
        CredentialPointer credential;
        Seconds addedAt = 0;
    };

    /// Adds a credential; one that is equal goes. False, with nothing changed, when it would be one
    /// too many.
    [[nodiscard]] bool add(CredentialPointer credential, Seconds now);

    /// Adds a passphrase; all others of its purpose go. False, with nothing changed, when it would
    /// be one too many.
    [[nodiscard]] bool replacePassphrases(CredentialPointer passphrase, Seconds now);

    void removeType(std::uint32_t type);
    void removeEqual(const KSTCredential& credential);
    void removePassphrases(KSTPassphrasePurpose purpose);
    /// Takes that very member out; nothing when it is not there.
    void remove(const KSTCredential* member);

    [[nodiscard]] bool containsType(std::uint32_t type) const;
    [[nodiscard]] bool containsPassphrase(KSTPassphrasePurpose purpose) const;

    [[nodiscard]] const std::vector<Member>& members() const { return members_; }

  private:
    template <typename Superseded>
    [[nodiscard]] bool addInPlaceOf(const Superseded& superseded, CredentialPointer credential,
                                    Seconds now);

    std::vector<Member> members_;
};

} // namespace keystrand
