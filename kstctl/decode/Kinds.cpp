#include "kstctl/decode/Kinds.h"

#include "KSTLib/Command.h"
#include "base/Concat.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/Payloads.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <iterator>

namespace kstctl::decode {

namespace {

bool beginsWith(Bytes bytes, std::string_view magic) {
    return bytes.size() >= magic.size() &&
           std::equal(magic.begin(), magic.end(), bytes.begin(), [](char character, auto byte) {
               return static_cast<unsigned char>(character) == byte;
           });
}

template <std::size_t Size>
bool hasSize(Bytes bytes) {
    return bytes.size() == Size;
}

bool mayBeAnything(Bytes /*bytes*/) {
    return true;
}

bool isFrame(Bytes bytes) {
    return beginsWith(bytes, KST_COMMAND_MAGIC);
}

bool isEvent(Bytes bytes) {
    return beginsWith(bytes, {wire::kEventMagic, sizeof wire::kEventMagic});
}

constexpr Kind kKinds[] = {
    {"frame", "a command frame", decodeFrame, isFrame, true},
    {"event", "an event datagram", decodeEvent, isEvent, true},
    {"record", "a notification record", decodeRecord, hasSize<wire::rm::kNotificationSize>},
    {"state", "a state file", decodeStateFile, hasSize<wire::rm::kStateBlobSize>},
    {"analytics", "an analytics file", decodeAnalyticsFile, hasSize<wire::rm::kAnalyticsBlobSize>},
    {"credential", "a credential", decodeCredential, mayBeAnything},
    {"credential-list", "a list of credentials", decodeCredentialList, mayBeAnything},
    {"requirement", "a requirement", decodeRequirement, mayBeAnything},
    {"context-property", "the payload that asks for a property of a context",
     decodeContextProperty},
};

} // namespace

std::span<const Kind> kinds() {
    return kKinds;
}

const Kind* findKind(std::string_view name) {
    const auto* const kind =
        std::find_if(std::begin(kKinds), std::end(kKinds),
                     [name](const Kind& candidate) { return candidate.name == name; });
    return kind != std::end(kKinds) ? kind : nullptr;
}

std::vector<const Kind*> kindsOf(Bytes bytes) {
    std::vector<const Kind*> found;
    for (const Kind& kind : kKinds) {
        if (kind.mayBe == nullptr || !kind.mayBe(bytes)) {
            continue;
        }
        if (kind.isCertain) {
            return {&kind};
        }
        const Result decoded = kind.decode(bytes, Secrets::hidden);
        if (decoded && decoded.value().size == bytes.size()) {
            found.push_back(&kind);
        }
    }
    return found;
}

std::vector<std::string> kindNames() {
    std::vector<std::string> names;
    for (const Kind& kind : kinds()) {
        names.emplace_back(kind.name);
    }
    return names;
}

std::vector<std::string> commandNames() {
    std::vector<std::string> names;
    for (const CommandPayload& command : commandPayloads()) {
        names.emplace_back(command.name);
        names.push_back(base::concat(command.code));
    }
    return names;
}

} // namespace kstctl::decode
