#include "KSTLib/DataBlob.h"
#include "KSTLib/Handle.h"
#include "KSTLib/VerifyPolicySerialization.h"
#include "kstctl/decode/AgeText.h"
#include "kstctl/decode/LibraryCall.h"
#include "kstctl/decode/ParameterFields.h"
#include "kstctl/decode/Payloads.h"

#include <string_view>

namespace kstctl::decode {

namespace {

constexpr std::size_t kFixedPolicySize = kKSTHandleSize + 1 + 1 + 4 + 4;

} // namespace

Result decodeVerifyPolicy(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    char* made = nullptr;
    std::uint8_t preflight = 0;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a verify-policy payload", [&] {
            return DeserializeVerifyPolicy(bytes.data(), bytes.size(), &handle, &made, &preflight,
                                           &age, &parameters.parameters, &parameters.count);
        })) {
        return *std::move(refusal);
    }
    const std::size_t length = std::string_view(made).size();
    const Received<char> policy(made, [length](char* text) { DeallocDataBlob(text, length + 1); });
    Decoded decoded{.fields = {}, .size = kFixedPolicySize + length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("policy", std::string_view(policy.get()))
        .add("preflight", preflight != 0)
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

} // namespace kstctl::decode
