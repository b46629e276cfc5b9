#include "KSTLib/Handle.h"
#include "KSTLib/ProcessAclSerialization.h"
#include "base/Saturate.h"
#include "kstctl/decode/AgeText.h"
#include "kstctl/decode/LibraryCall.h"
#include "kstctl/decode/ParameterFields.h"
#include "kstctl/decode/Payloads.h"
#include "kstctl/decode/ReceivedBlob.h"

namespace kstctl::decode {

namespace {

constexpr std::size_t kFixedSize = kKSTHandleSize + 4 + 4 + 4 + 4;

} // namespace

Result decodeProcessAcl(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    ReceivedBlob acl;
    ReceivedBlob operation;
    std::uint32_t age = 0;
    ReceivedParameters parameters;
    if (auto refusal = refusalOf("a parse-acl payload", [&] {
            return DeserializeProcessAcl(bytes.data(), base::saturate<std::uint32_t>(bytes.size()),
                                         &handle, &acl.data, &acl.length, &operation.data,
                                         &operation.length, &age, &parameters.parameters,
                                         &parameters.count);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {},
                    .size = kFixedSize + acl.length + operation.length + parameters.wireSize()};
    decoded.fields.add("handle", hexText(handle.bytes))
        .add("acl", hexText(acl.bytes()))
        .add("operation", hexText(operation.bytes()))
        .add("maxGlobalCredentialAge", age, ageText(age))
        .add("parameters", parameters.fields());
    return decoded;
}

} // namespace kstctl::decode
