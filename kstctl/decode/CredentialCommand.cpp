#include "KSTLib/CredentialCommandSerialization.h"
#include "KSTLib/CredentialSerialization.h"
#include "common/CredentialTypes.h"
#include "kstctl/decode/CredentialFields.h"
#include "kstctl/decode/LibraryCall.h"
#include "kstctl/decode/Payloads.h"
#include "kstctl/decode/ScopeText.h"

namespace kstctl::decode {

Result decodeCredentialCommand(Bytes bytes, Secrets secrets) {
    KSTHandle handle{};
    KSTCredential* made = nullptr;
    KSTScope scope = 0;
    if (auto refusal = refusalOf("a credential command's payload", [&] {
            return DeserializeAddCredential(bytes.data(), bytes.size(), &handle, &made, &scope);
        })) {
        return *std::move(refusal);
    }
    const Received<KSTCredential> credential(made, DeallocCredential);
    Decoded decoded{.fields = {},
                    .size =
                        sizeof handle + kst::credentialSize(credential->dataLength) + sizeof scope};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("credential", credentialFields(*credential, secrets))
        .add("scope", scope, scopeText(scope));
    return decoded;
}

} // namespace kstctl::decode
