#include "KSTLib/Handle.h"
#include "KSTLib/VerifyAclSerialization.h"
#include "base/Saturate.h"
#include "kstctl/decode/AgeText.h"
#include "kstctl/decode/LibraryCall.h"
#include "kstctl/decode/ParameterFields.h"
#include "kstctl/decode/Payloads.h"
#include "kstctl/decode/ReceivedBlob.h"

namespace kstctl::decode {

namespace {

constexpr std::size_t kFixedAclSize = kKSTHandleSize + 4 + 1 + 4 + 4;

} // namespace

Result decodeVerifyAclConstraint(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    ReceivedBlob constraint;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a verify-acl-constraint payload", [&] {
            return DeserializeVerifyAclConstraint(
                bytes.data(), base::saturate<std::uint32_t>(bytes.size()), &handle,
                &constraint.data, &constraint.length, &preflight, &age, &parameters.parameters,
                &parameters.count);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {},
                    .size = kFixedAclSize + constraint.length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("constraint", hexText(constraint.bytes()))
        .add("preflight", preflight != 0)
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

} // namespace kstctl::decode
