#include "keystrand-sim/Withholding.h"

#include "KSTLib/Command.h"
#include "KSTLib/Handle.h"
#include "base/ByteReader.h"
#include "common/CredentialTypes.h"

#include <algorithm>

namespace keystrand::sim {

namespace {

bool carriesCredential(std::uint8_t command) {
    return command == kKSTCommandAddCredential || command == kKSTCommandRemoveCredentialsByValue ||
           command == kKSTCommandReplacePassphraseCredentials;
}

} // namespace

std::optional<Withholding> withholdingFrom(std::uint8_t command,
                                           std::span<const std::uint8_t> payload) {
    if (!carriesCredential(command)) {
        return std::nullopt;
    }
    Withholding withholding;
    withholding.kept = std::min<std::size_t>(payload.size(), kKSTHandleSize);
    base::ByteReader reader(payload);
    std::uint32_t type = 0;
    // Any other number may be a piece of a secret that is out of its place.
    if (reader.skip(kKSTHandleSize) && reader.readU32(type) &&
        kst::findCredentialType(type) != nullptr) {
        withholding.credentialType = static_cast<std::uint8_t>(type);
    }
    return withholding;
}

} // namespace keystrand::sim
