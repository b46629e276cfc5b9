#include "wire/GateMessages.h"

#include "base/Concat.h"
#include "base/LineWords.h"

#include <algorithm>
#include <array>
#include <utility>

namespace wire {

namespace {

constexpr std::string_view kDone = "ok\n";
constexpr std::string_view kDevices = "devices\n";
constexpr std::string_view kStatus = "status\n";
constexpr std::string_view kError = "error ";

/// The flags of a status, by their words.
struct Flag {
    std::string_view word;
    bool GateStatus::*value;
};
constexpr std::array<Flag, 8> kFlags = {{
    {"locked", &GateStatus::locked},
    {"starting", &GateStatus::starting},
    {"sleeping", &GateStatus::sleeping},
    {"restricted", &GateStatus::restricted},
    {"closed", &GateStatus::closed},
    {"allowed", &GateStatus::allowed},
    {"password-set", &GateStatus::passwordSet},
    {"boot-argument", &GateStatus::bootArgument},
}};

/// The next word, one of these two.
bool isYes(base::LineWords& words, std::string_view yes, std::string_view no) {
    const std::string_view said = words.word();
    words.require(said == yes || said == no);
    return said == yes;
}

std::string hexText(std::string_view text) {
    return base::hexWord(text.substr(0, kMostGateText));
}

std::string_view plainWord(const std::string& text) {
    return text.empty() ? base::kEmptyWord : text;
}

std::string lineOf(const GateDevice& device) {
    return base::concat(device.port, ' ', std::to_string(device.number), ' ',
                        std::to_string(device.inode), ' ', std::to_string(device.vendor), ' ',
                        std::to_string(device.product), ' ', hexText(device.manufacturer), ' ',
                        hexText(device.name), ' ', hexText(device.serial), ' ',
                        plainWord(device.classes), ' ', device.accepted ? "in" : "out", ' ',
                        plainWord(device.rule), ' ', std::to_string(device.forSeconds), '\n');
}

std::optional<GateDevice> deviceIn(std::string_view line) {
    base::LineWords words(line);
    GateDevice device;
    device.port = words.word();
    device.number = words.number<std::uint32_t>();
    device.inode = words.number<std::uint64_t>();
    device.vendor = words.number<std::uint16_t>();
    device.product = words.number<std::uint16_t>();
    device.manufacturer = words.bytes();
    device.name = words.bytes();
    device.serial = words.bytes();
    device.classes = words.wordOrNothing();
    device.accepted = isYes(words, "in", "out");
    device.rule = words.wordOrNothing();
    device.forSeconds = words.number<std::uint64_t>();
    return words.isDone() ? std::optional(std::move(device)) : std::nullopt;
}

std::string encoded(const GateDevices& devices) {
    std::string text(kDevices);
    for (std::size_t index = 0; index < std::min(devices.size(), kMostGateDevices); ++index) {
        text += lineOf(devices[index]);
    }
    return text;
}

std::string timeLine(std::string_view word, const std::optional<std::uint64_t>& seconds) {
    return seconds ? base::concat(word, ' ', std::to_string(*seconds), '\n') : std::string();
}

std::string encoded(const GateStatus& status) {
    std::string text(kStatus);
    for (const Flag& flag : kFlags) {
        text += base::concat(flag.word, ' ', status.*flag.value ? "yes" : "no", '\n');
    }
    return text + timeLine("until-restricted", status.untilRestricted) +
           timeLine("until-closed", status.untilClosed) +
           base::concat("refused ", std::to_string(status.refused), '\n') +
           (status.gap.empty() ? std::string() : base::concat("gap ", hexText(status.gap), '\n'));
}

std::optional<GateDevices> decodedDevices(const std::vector<std::string_view>& lines) {
    GateDevices devices;
    for (const std::string_view line : lines) {
        auto device = deviceIn(line);
        if (!device || devices.size() == kMostGateDevices) {
            return std::nullopt;
        }
        devices.push_back(std::move(*device));
    }
    return devices;
}

bool takeStatusLine(GateStatus& status, std::string_view line) {
    base::LineWords words(line);
    const std::string_view word = words.word();
    const auto* const flag = std::find_if(kFlags.begin(), kFlags.end(),
                                          [&](const Flag& each) { return each.word == word; });
    if (flag != kFlags.end()) {
        status.*flag->value = isYes(words, "yes", "no");
    } else if (word == "until-restricted") {
        status.untilRestricted = words.number<std::uint64_t>();
    } else if (word == "until-closed") {
        status.untilClosed = words.number<std::uint64_t>();
    } else if (word == "refused") {
        status.refused = words.number<std::uint32_t>();
    } else if (word == "gap") {
        status.gap = words.bytes();
    } else {
        return false;
    }
    return words.isDone();
}

std::optional<GateAnswer> readAnswer(std::string_view text) {
    if (text == kDone) {
        return GateDone();
    }
    if (text.starts_with(kError)) {
        return GateRefusal{
            std::string(text.substr(kError.size(), text.size() - kError.size() - 1))};
    }
    if (text.starts_with(kDevices)) {
        const auto lines = base::linesOf(text.substr(kDevices.size()));
        auto devices = lines ? decodedDevices(*lines) : std::nullopt;
        return devices ? std::optional<GateAnswer>(std::move(*devices)) : std::nullopt;
    }
    const auto lines =
        text.starts_with(kStatus) ? base::linesOf(text.substr(kStatus.size())) : std::nullopt;
    GateStatus status;
    const bool taken = lines && std::all_of(lines->begin(), lines->end(), [&](auto line) {
                           return takeStatusLine(status, line);
                       });
    return taken ? std::optional<GateAnswer>(status) : std::nullopt;
}

std::optional<GateRequest> readRequest(std::string_view text) {
    if (text == kDevices) {
        return GateDevicesRequest();
    }
    if (text == kStatus) {
        return GateStatusRequest();
    }
    if (!text.ends_with('\n')) {
        return std::nullopt;
    }
    base::LineWords words(text.substr(0, text.size() - 1));
    const std::string_view what = words.word();
    std::optional<GateRequest> request;
    if (what == "accept") {
        GateAcceptRequest accept;
        accept.port = words.word();
        accept.number = words.number<std::uint32_t>();
        accept.inode = words.number<std::uint64_t>();
        request = std::move(accept);
    } else if (what == "open") {
        const auto seconds = words.number<std::uint32_t>();
        if (seconds <= kMostGateOpenSeconds) {
            request = GateOpenRequest{.seconds = seconds};
        }
    }
    return words.isDone() ? request : std::nullopt;
}

} // namespace

std::string encodeGateRequest(const GateRequest& request) {
    if (const auto* const accept = std::get_if<GateAcceptRequest>(&request)) {
        return base::concat("accept ", accept->port, ' ', std::to_string(accept->number), ' ',
                            std::to_string(accept->inode), '\n');
    }
    if (const auto* const open = std::get_if<GateOpenRequest>(&request)) {
        return base::concat("open ", std::to_string(open->seconds), '\n');
    }
    return std::string(std::holds_alternative<GateStatusRequest>(request) ? kStatus : kDevices);
}

std::optional<GateRequest> decodeGateRequest(std::string_view text) {
    auto request = readRequest(text);
    // One text for one request: numbers have one form.
    return request && encodeGateRequest(*request) == text ? std::move(request) : std::nullopt;
}

std::string encodeGateAnswer(const GateAnswer& answer) {
    if (const auto* const refusal = std::get_if<GateRefusal>(&answer)) {
        return base::concat(kError, refusal->reason, '\n');
    }
    if (const auto* const devices = std::get_if<GateDevices>(&answer)) {
        return encoded(*devices);
    }
    const auto* const status = std::get_if<GateStatus>(&answer);
    return status != nullptr ? encoded(*status) : std::string(kDone);
}

std::optional<GateAnswer> decodeGateAnswer(std::string_view text) {
    auto answer = readAnswer(text);
    return answer && encodeGateAnswer(*answer) == text ? std::move(answer) : std::nullopt;
}

} // namespace wire
