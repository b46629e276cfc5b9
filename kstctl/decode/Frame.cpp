#include "KSTLib/Command.h"
#include "base/ByteReader.h"
#include "base/Concat.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/Payloads.h"

#include <string>
#include <string_view>
#include <utility>

namespace kstctl::decode {

namespace {

/// Nothing is known of the payload of a command that does not exist, so it may hold a secret.
Report unknownPayload(Bytes payload, Secrets secrets) {
    Report report;
    report.add("size", payload.size());
    if (secrets == Secrets::shown) {
        report.add("bytes", hexText(payload));
    } else {
        report.add("bytes", Report::Unknown{"hidden; --show-secrets shows them"});
    }
    return report;
}

} // namespace

Result decodeFrame(Bytes bytes, Secrets secrets) {
    base::ByteReader reader(bytes);
    std::string_view magic;
    std::uint8_t code = 0;
    std::uint8_t second = 0;
    std::uint8_t third = 0;
    std::uint8_t unused = 0;
    if (!reader.readText(magic, kKSTCommandMagicSize) || !reader.readU8(code) ||
        !reader.readU8(second) || !reader.readU8(third) || !reader.readU8(unused)) {
        return malformed(base::concat("a command frame has at least ",
                                      std::size_t{kKSTCommandHeaderSize}, " bytes, not ",
                                      bytes.size()));
    }
    if (magic != KST_COMMAND_MAGIC) {
        return malformed("a command frame begins with " KST_COMMAND_MAGIC);
    }
    const CommandPayload* const command = findCommand(code);
    Decoded decoded{.fields = {}, .size = bytes.size()};
    decoded.fields.add("command", code, command != nullptr ? std::string(command->name) : "")
        .add("secondByte", second)
        .add("thirdByte", third)
        .add("unusedByte", unused);
    if (command == nullptr) {
        decoded.fields.add("payload", unknownPayload(reader.rest(), secrets));
        return decoded;
    }
    Result payload = command->decode(reader.rest(), secrets);
    if (!payload) {
        return malformed(
            base::concat("command ", code, ", ", command->name, ": ", payload.error().description));
    }
    Decoded fields = std::move(payload).value();
    decoded.size = kKSTCommandHeaderSize + fields.size;
    decoded.fields.add("payload", std::move(fields.fields));
    return decoded;
}

} // namespace kstctl::decode
