#include "base/ByteReader.h"
#include "base/Concat.h"
#include "kstctl/TimeText.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/RecordFields.h"
#include "wire/RestrictedMode.h"

namespace kstctl::decode {

void addStateFields(Report& report, Bytes blob) {
    base::ByteReader reader(blob);
    std::uint32_t version = 0;
    std::uint64_t start = 0;
    std::uint8_t locked = 0;
    if (reader.readU32(version) && reader.readU64(start) && reader.readU8(locked)) {
        report.add("version", version)
            .add("standardModeStartTimestamp", start, timeText(start))
            .add("lockedInRestrictedMode", locked);
    }
}

Result decodeStateFile(Bytes bytes, Secrets /*secrets*/) {
    if (bytes.size() < wire::rm::kStateBlobSize) {
        return malformed(base::concat("a state file has at least ", wire::rm::kStateBlobSize,
                                      " bytes, not ", bytes.size()));
    }
    Decoded decoded{.fields = {}, .size = wire::rm::kStateBlobSize};
    addStateFields(decoded.fields, bytes);
    return decoded;
}

} // namespace kstctl::decode
