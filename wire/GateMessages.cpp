#include "wire/GateMessages.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>
#include <array>
#include <utility>

namespace wire {

namespace {

constexpr std::string_view kEmpty = "-";
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

/// Takes words of one line; what is missing or not as it should be spoils it.
class GateWords {
  public:
    explicit GateWords(std::string_view line) : rest_(line) {}

    std::string_view word() {
        const std::size_t end = std::min(rest_.find(' '), rest_.size());
        const std::string_view word = rest_.substr(0, end);
        rest_.remove_prefix(std::min(end + 1, rest_.size()));
        isGood_ = isGood_ && !word.empty();
        return word;
    }
    std::string text() {
        const std::string_view digits = word();
        std::string bytes;
        for (std::size_t at = 0; digits != kEmpty && at < digits.size(); at += 2) {
            const auto high = base::hexDigitValue(digits[at]);
            const auto low =
                at + 1 < digits.size() ? base::hexDigitValue(digits[at + 1]) : std::nullopt;
            isGood_ = isGood_ && high && low;
            bytes.push_back(static_cast<char>((high.value_or(0) << 4U) | low.value_or(0)));
        }
        return bytes;
    }
    std::string plain() {
        const std::string_view plain = word();
        return plain == kEmpty ? std::string() : std::string(plain);
    }
    template <typename Number>
    Number number() {
        const auto value = base::parseNumber<Number>(word());
        isGood_ = isGood_ && value;
        return value.value_or(0);
    }
    bool isYes(std::string_view yes, std::string_view no) {
        const std::string_view said = word();
        isGood_ = isGood_ && (said == yes || said == no);
        return said == yes;
    }
    [[nodiscard]] bool isDone() const { return isGood_ && rest_.empty(); }

  private:
    std::string_view rest_;
    bool isGood_ = true;
};

/// The lines of a text that ends with one.
std::optional<std::vector<std::string_view>> linesOf(std::string_view text) {
    std::vector<std::string_view> lines;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        if (end == std::string_view::npos) {
            return std::nullopt;
        }
        lines.push_back(text.substr(0, end));
        text.remove_prefix(end + 1);
    }
    return lines;
}

std::string hexText(std::string_view text) {
    const auto* const bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    return text.empty() ? std::string(kEmpty)
                        : base::hexDigits({bytes, std::min(text.size(), kMostGateText)});
}

std::string plainWord(const std::string& text) {
    return text.empty() ? std::string(kEmpty) : text;
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
    GateWords words(line);
    GateDevice device;
    device.port = words.word();
    device.number = words.number<std::uint32_t>();
    device.inode = words.number<std::uint64_t>();
    device.vendor = words.number<std::uint16_t>();
    device.product = words.number<std::uint16_t>();
    device.manufacturer = words.text();
    device.name = words.text();
    device.serial = words.text();
    device.classes = words.plain();
    device.accepted = words.isYes("in", "out");
    device.rule = words.plain();
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
           base::concat("refused ", std::to_string(status.refused), '\n');
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
    GateWords words(line);
    const std::string_view word = words.word();
    const auto* const flag = std::find_if(kFlags.begin(), kFlags.end(),
                                          [&](const Flag& each) { return each.word == word; });
    if (flag != kFlags.end()) {
        status.*flag->value = words.isYes("yes", "no");
    } else if (word == "until-restricted") {
        status.untilRestricted = words.number<std::uint64_t>();
    } else if (word == "until-closed") {
        status.untilClosed = words.number<std::uint64_t>();
    } else if (word == "refused") {
        status.refused = words.number<std::uint32_t>();
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
        const auto lines = linesOf(text.substr(kDevices.size()));
        auto devices = lines ? decodedDevices(*lines) : std::nullopt;
        return devices ? std::optional<GateAnswer>(std::move(*devices)) : std::nullopt;
    }
    const auto lines =
        text.starts_with(kStatus) ? linesOf(text.substr(kStatus.size())) : std::nullopt;
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
    GateWords words(text.substr(0, text.size() - 1));
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
