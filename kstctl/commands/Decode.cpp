#include "base/Concat.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"
#include "kstctl/commands/Inputs.h"
#include "kstctl/decode/Kinds.h"
#include "kstctl/decode/Payloads.h"

#include <cstring>
#include <string_view>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

/// What the bytes are and how they are read.
struct Reading {
    std::string kind;
    decode::Decoder decode = nullptr;
};

platform::Result<platform::Bytes> bytesOf(const DecodeCommand& command) {
    if (!command.digits.empty()) {
        std::string text;
        for (const std::string& word : command.digits) {
            text += base::concat(word, ' ');
        }
        return bytesOfHex(text);
    }
    if (!command.file && ::isatty(STDIN_FILENO) == 1) {
        return failure(ExitStatus::usage, "give the bytes, or a file with --file");
    }
    auto input = readInput(command.file.value_or("-"));
    if (!input || !command.isHex) {
        return input;
    }
    const platform::Bytes& bytes = input.value();
    return bytesOfHex({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
}

platform::Error undecided(const std::vector<const decode::Kind*>& kinds) {
    std::string names;
    for (const decode::Kind* const kind : kinds) {
        names += base::concat(names.empty() ? "" : ", ", kind->name);
    }
    return failure(
        ExitStatus::malformed,
        kinds.empty()
            ? "these bytes are of no kind that shows by itself; say which with --kind"
            : base::concat("these bytes may be of the kinds ", names, "; say which with --kind"));
}

platform::Result<Reading> readingOf(const DecodeCommand& command, decode::Bytes bytes) {
    if (command.payloadOf) {
        const decode::CommandPayload* const payload = decode::findCommand(*command.payloadOf);
        return Reading{.kind = std::string(payload->name), .decode = payload->decode};
    }
    if (command.kind) {
        return Reading{.kind = *command.kind, .decode = decode::findKind(*command.kind)->decode};
    }
    const auto kinds = decode::kindsOf(bytes);
    if (kinds.size() != 1) {
        return undecided(kinds);
    }
    return Reading{.kind = std::string(kinds.front()->name), .decode = kinds.front()->decode};
}

ExitStatus decodeBytes(const DecodeCommand& command, decode::Bytes bytes, Output& output) {
    const auto reading = readingOf(command, bytes);
    if (!reading) {
        return output.finish(reading.error());
    }
    auto result = reading.value().decode(bytes, command.showSecrets ? decode::Secrets::shown
                                                                    : decode::Secrets::hidden);
    if (!result) {
        return output.finish(result.error());
    }
    decode::Decoded decoded = std::move(result).value();
    Report report;
    report.add("kind", reading.value().kind)
        .add("size", decoded.size)
        .add("trailing", bytes.size() - decoded.size,
             bytes.size() == decoded.size ? "" : "bytes behind it, not looked at")
        .add("fields", std::move(decoded.fields));
    output.show(report);
    return output.finish(ExitStatus::success);
}

} // namespace

ExitStatus run(const DecodeCommand& command, const Environment& environment) {
    auto input = bytesOf(command);
    if (!input) {
        return environment.output.finish(input.error());
    }
    platform::Bytes bytes = std::move(input).value();
    const ExitStatus status = decodeBytes(command, bytes, environment.output);
    if (!bytes.empty()) {
        // It may have been a passphrase.
        ::explicit_bzero(bytes.data(), bytes.size());
    }
    return status;
}

} // namespace kstctl
