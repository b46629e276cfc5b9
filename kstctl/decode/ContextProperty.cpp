#include "KSTLib/ContextPropertySerialization.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/LibraryCall.h"

namespace kstctl::decode {

Result decodeContextProperty(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    KSTContextProperty property = 0;
    if (auto refusal = refusalOf("the payload that asks for a property of a context", [&] {
            return DeserializeGetContextProperty(bytes.data(), bytes.size(), &handle, &property);
        })) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {}, .size = sizeof handle + sizeof property};
    decoded.fields.add("handle", hexText(handle.bytes)).add("property", property);
    return decoded;
}

} // namespace kstctl::decode
