// The payloads that are a number and bytes: environment variables and kernel control.

#include "KSTLib/Command.h"
#include "base/ByteReader.h"
#include "base/Concat.h"
#include "kstctl/decode/Payloads.h"
#include "kstctl/decode/RecordFields.h"
#include "wire/RestrictedMode.h"

#include <algorithm>

namespace kstctl::decode {

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

} // namespace

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

} // namespace kstctl::decode
