#include "kstctl/decode/Payloads.h"

#include "KSTLib/Command.h"
#include "base/ByteReader.h"
#include "base/Concat.h"
#include "kstctl/decode/Decoders.h"
#include "wire/CommandTable.h"
#include "wire/RestrictedMode.h"

#include <algorithm>
#include <array>
#include <iterator>
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

// The payloads that are a handle and numbers, or less. The library writes them field by field where
// it sends them and reads none, so they are read here.

namespace {

platform::Error tooShort(std::size_t wanted, std::size_t given) {
    return malformed(base::concat("the payload has ", wanted, " bytes, not ", given));
}

struct HandleAndNumbers {
    KSTHandle handle{};
    std::uint32_t first = 0;
    std::uint32_t second = 0;

    static constexpr std::size_t kSize = kKSTHandleSize + 4 + 4;
};

std::optional<HandleAndNumbers> read(Bytes bytes) {
    HandleAndNumbers payload;
    base::ByteReader reader(bytes);
    if (!reader.readBytes(payload.handle.bytes, kKSTHandleSize) || !reader.readU32(payload.first) ||
        !reader.readU32(payload.second)) {
        return std::nullopt;
    }
    return payload;
}

/// The second number is a scope in the commands that remove, and the kernel service's own in those
/// that ask.
enum class Second { scope, argument };

Result decodeNumbers(Bytes bytes, const char* firstName, bool isType, Second second) {
    const auto payload = read(bytes);
    if (!payload) {
        return tooShort(HandleAndNumbers::kSize, bytes.size());
    }
    Decoded decoded{.fields = {}, .size = HandleAndNumbers::kSize};
    decoded.fields.add("handle", hexText(payload->handle.bytes))
        .add(firstName, payload->first, isType ? credentialTypeText(payload->first) : "");
    if (second == Second::scope) {
        decoded.fields.add("scope", payload->second, scopeText(payload->second));
    } else {
        decoded.fields.add("argument", payload->second);
    }
    return decoded;
}

Result decodeNoPayload(Bytes /*bytes*/, Secrets /*secrets*/) {
    return Decoded{};
}

Result decodeHandle(Bytes bytes, Secrets /*secrets*/) {
    KSTHandle handle{};
    if (base::ByteReader reader(bytes); !reader.readBytes(handle.bytes, kKSTHandleSize)) {
        return tooShort(kKSTHandleSize, bytes.size());
    }
    Decoded decoded{.fields = {}, .size = kKSTHandleSize};
    decoded.fields.add("handle", hexText(handle.bytes));
    return decoded;
}

Result decodeContainsCredentialType(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "type", true, Second::argument);
}

Result decodeRemoveCredentialsByType(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "type", true, Second::scope);
}

Result decodeContainsPassphrase(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "purpose", false, Second::argument);
}

Result decodeRemovePassphrases(Bytes bytes, Secrets /*secrets*/) {
    return decodeNumbers(bytes, "purpose", false, Second::scope);
}

} // namespace

// The payloads that are a number and bytes: environment variables and kernel control.

using namespace wire::rm;

namespace {

/// A control code, its name and its input.
struct Control {
    std::uint32_t code;
    const char* name;
    std::size_t inputSize;
    void (*addInput)(Report& report, Bytes input);
};

void addDaemonStarted(Report& report, Bytes input) {
    report.add("restrictedModeAllowed", input[kDaemonStartedAllowedOffset])
        .add("reserved", hexText(input.subspan(1, kDaemonStartedStateOffset - 1)));
    addStateFields(report, input.subspan(kDaemonStartedStateOffset));
}

void addSetAllowed(Report& report, Bytes input) {
    report.add("restrictedModeAllowed", input.front());
}

void addAcknowledgement(Report& report, Bytes input) {
    const auto end = std::find(input.begin(), input.end(), 0);
    report.add("property", std::string(input.begin(), end));
}

constexpr Control kControls[] = {
    {kKSTKernelControlRMDaemonStarted, "daemon started", kDaemonStartedPayloadSize,
     addDaemonStarted},
    {kKSTKernelControlRMSetAllowed, "set allowed", kSetAllowedPayloadSize, addSetAllowed},
    {kKSTKernelControlRMRestoreAnalytics, "restore analytics", kAnalyticsBlobSize,
     addAnalyticsFields},
    {kKSTKernelControlRMNotificationAck, "acknowledge a notification", kNotificationAckPayloadSize,
     addAcknowledgement},
};

/// Reads the number; what is left of `reader` are the bytes behind it.
std::optional<platform::Error> refusalOfNumber(base::ByteReader& reader, std::uint32_t& number,
                                               std::size_t maxRest) {
    if (!reader.readU32(number)) {
        return malformed(base::concat("the payload has at least 4 bytes, not ", reader.left()));
    }
    if (reader.left() > maxRest) {
        return malformed(base::concat("the payload has at most ", maxRest,
                                      " bytes behind its number, not ", reader.left()));
    }
    return std::nullopt;
}

Result decodeSetEnvironmentVariable(Bytes bytes, Secrets /*secrets*/) {
    base::ByteReader reader(bytes);
    std::uint32_t variable = 0;
    if (auto refusal = refusalOfNumber(reader, variable, kKSTEnvironmentVariableMaxSize)) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {}, .size = bytes.size()};
    decoded.fields.add("variable", variable)
        .add("value", hexText(reader.rest()), reader.left() == 0 ? "the variable goes" : "");
    return decoded;
}

Result decodeGetEnvironmentVariable(Bytes bytes, Secrets /*secrets*/) {
    base::ByteReader reader(bytes);
    std::uint32_t variable = 0;
    if (auto refusal = refusalOfNumber(reader, variable, bytes.size())) {
        return *std::move(refusal);
    }
    Decoded decoded{.fields = {}, .size = sizeof variable};
    decoded.fields.add("variable", variable);
    return decoded;
}

Result decodeKernelControl(Bytes bytes, Secrets /*secrets*/) {
    base::ByteReader reader(bytes);
    std::uint32_t code = 0;
    if (auto refusal = refusalOfNumber(reader, code, kKSTKernelControlMaxSize)) {
        return *std::move(refusal);
    }
    const Bytes input = reader.rest();
    const auto* const control =
        std::find_if(std::begin(kControls), std::end(kControls),
                     [code](const Control& candidate) { return candidate.code == code; });
    Decoded decoded{.fields = {}, .size = bytes.size()};
    if (control == std::end(kControls)) {
        decoded.fields.add("control", code).add("input", hexText(input));
        return decoded;
    }
    if (input.size() != control->inputSize) {
        return malformed(base::concat("the input of control code ", code, " has ",
                                      control->inputSize, " bytes, not ", input.size()));
    }
    decoded.fields.add("control", code, control->name);
    control->addInput(decoded.fields, input);
    return decoded;
}

/// The decoder of a command that the table has.
constexpr Decoder decoderOf(std::uint8_t code) {
    switch (code) {
    case kKSTCommandContextCreate:
        return decodeNoPayload;
    case kKSTCommandContextDelete:
    case kKSTCommandContextCreateWithExternalForm:
    case kKSTCommandContextGetExternalForm:
        return decodeHandle;
    case kKSTCommandVerifyPolicy:
        return decodeVerifyPolicy;
    case kKSTCommandContainsCredentialType:
        return decodeContainsCredentialType;
    case kKSTCommandAddCredential:
    case kKSTCommandRemoveCredentialsByValue:
    case kKSTCommandReplacePassphraseCredentials:
        return decodeCredentialCommand;
    case kKSTCommandRemoveCredentialsByType:
        return decodeRemoveCredentialsByType;
    case kKSTCommandVerifyAclConstraint:
        return decodeVerifyAclConstraint;
    case kKSTCommandContainsPassphraseCredential:
        return decodeContainsPassphrase;
    case kKSTCommandRemovePassphraseCredentials:
        return decodeRemovePassphrases;
    case kKSTCommandParseAcl:
        return decodeProcessAcl;
    case kKSTCommandSetEnvironmentVariable:
        return decodeSetEnvironmentVariable;
    case kKSTCommandGetEnvironmentVariable:
        return decodeGetEnvironmentVariable;
    case kKSTCommandKernelControl:
        return decodeKernelControl;
    default:
        return nullptr;
    }
}

constexpr auto kCommands = [] {
    std::array<CommandPayload, std::size(wire::kCommandKinds)> commands{};
    std::transform(std::begin(wire::kCommandKinds), std::end(wire::kCommandKinds), commands.begin(),
                   [](const wire::CommandKind& kind) {
                       return CommandPayload{kind.code, kind.name, decoderOf(kind.code)};
                   });
    return commands;
}();
static_assert(std::all_of(kCommands.begin(), kCommands.end(),
                          [](const CommandPayload& command) { return command.decode != nullptr; }),
              "a command has no decoder");

template <typename Matches>
const CommandPayload* findWhere(Matches matches) {
    const auto found = std::find_if(kCommands.begin(), kCommands.end(), matches);
    return found != kCommands.end() ? &*found : nullptr;
}

} // namespace

std::span<const CommandPayload> commandPayloads() {
    return kCommands;
}

const CommandPayload* findCommand(std::uint32_t code) {
    return findWhere([code](const CommandPayload& command) { return command.code == code; });
}

const CommandPayload* findCommand(std::string_view nameOrCode) {
    return findWhere([nameOrCode](const CommandPayload& command) {
        return command.name == nameOrCode || base::concat(command.code) == nameOrCode;
    });
}

} // namespace kstctl::decode
