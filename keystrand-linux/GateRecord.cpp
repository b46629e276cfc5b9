#include "keystrand-linux/GateRecord.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>
#include <array>
#include <utility>
#include <vector>

namespace keystrand::usb {

namespace {

constexpr std::string_view kGateHead = "keystrand-gate 1";
constexpr std::string_view kDevicesHead = "keystrand-devices 1";
constexpr std::string_view kEnd = "end";
/// Stands for an empty word.
constexpr std::string_view kNothing = "-";

constexpr std::array<std::pair<Standing, std::string_view>, 10> kStandings = {{
    {Standing::attached, "attached"},
    {Standing::hardWired, "hard-wired"},
    {Standing::keyboard, "keyboard"},
    {Standing::probe, "probe"},
    {Standing::keyboardHub, "keyboard-hub"},
    {Standing::inUse, "in-use"},
    {Standing::administrator, "administrator"},
    {Standing::letInByOthers, "let-in-by-others"},
    {Standing::refused, "refused"},
    {Standing::refusedByOthers, "refused-by-others"},
}};

constexpr std::array<std::pair<GateState::Phase, std::string_view>, 3> kPhases = {{
    {GateState::Phase::open, "open"},
    {GateState::Phase::closed, "closed"},
    {GateState::Phase::opening, "opening"},
}};

constexpr std::array<std::pair<bool, std::string_view>, 2> kConfirmations = {{
    {false, "decided"},
    {true, "done"},
}};

template <typename Table, typename Value>
std::string_view nameIn(const Table& table, const Value& value) {
    return std::find_if(table.begin(), table.end(),
                        [&](const auto& entry) { return entry.first == value; })
        ->second;
}

template <typename Value, std::size_t size>
std::optional<Value> valueIn(const std::array<std::pair<Value, std::string_view>, size>& table,
                             std::string_view name) {
    const auto found = std::find_if(table.begin(), table.end(),
                                    [&](const auto& entry) { return entry.second == name; });
    return found == table.end() ? std::nullopt : std::optional(found->first);
}

/// The words of one line, which are all taken or the line is none of ours.
class Line {
  public:
    explicit Line(std::string_view line) : rest_(line) {}

    std::string_view word() {
        const std::size_t end = std::min(rest_.find(' '), rest_.size());
        const std::string_view word = rest_.substr(0, end);
        rest_.remove_prefix(std::min(end + 1, rest_.size()));
        isGood_ = isGood_ && !word.empty();
        return word;
    }

    template <typename Integer>
    Integer number() {
        const auto value = base::parseNumber<Integer>(word());
        isGood_ = isGood_ && value;
        return value.value_or(0);
    }

    template <typename Table>
    auto named(const Table& table) {
        const auto value = valueIn(table, word());
        isGood_ = isGood_ && value;
        return value.value_or(table.front().first);
    }

    std::string bytes() {
        const std::string_view digits = word();
        if (digits == kNothing) {
            return {};
        }
        std::string bytes;
        for (std::size_t at = 0; at + 1 < digits.size(); at += 2) {
            const auto high = base::hexDigitValue(digits[at]);
            const auto low = base::hexDigitValue(digits[at + 1]);
            isGood_ = isGood_ && high && low;
            bytes.push_back(static_cast<char>((high.value_or(0) << 4U) | low.value_or(0)));
        }
        isGood_ = isGood_ && digits.size() % 2 == 0;
        return bytes;
    }

    [[nodiscard]] bool isDone() const { return isGood_ && rest_.empty(); }

  private:
    std::string_view rest_;
    bool isGood_ = true;
};

/// The lines between head and end, each of which `take` understands; false otherwise.
template <typename Take>
bool takeLines(std::string_view text, std::string_view head, Take take) {
    bool first = true;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        if (end == std::string_view::npos) {
            return false;
        }
        const std::string_view line = text.substr(0, end);
        text.remove_prefix(end + 1);
        if (line == kEnd && !first) {
            return text.empty();
        }
        if (first ? line != head : !take(Line(line))) {
            return false;
        }
        first = false;
    }
    return false;
}

std::string hex(std::string_view bytes) {
    const auto* const data = reinterpret_cast<const std::uint8_t*>(bytes.data());
    return bytes.empty() ? std::string(kNothing) : base::hexDigits({data, bytes.size()});
}

std::string words(const WrittenDefault& value) {
    return base::concat(std::to_string(value.before), ' ', std::to_string(value.written), ' ',
                        nameIn(kConfirmations, value.confirmed));
}

WrittenDefault takeDefault(Line& line) {
    WrittenDefault value;
    value.before = line.number<AuthorizedDefault>();
    value.written = line.number<AuthorizedDefault>();
    value.confirmed = line.named(kConfirmations);
    return value;
}

bool takeGateLine(GateRecord& record, Line line) {
    const std::string_view what = line.word();
    if (what == "phase") {
        record.gate.phase = line.named(kPhases);
    } else if (what == "restricted") {
        record.service.restricted = true;
    } else if (what == "starting") {
        record.service.starting = true;
    } else if (what == "open-until") {
        record.service.openUntil = BootTime(line.number<BootTime::rep>());
    } else if (what == "parameter") {
        record.gate.parameter = takeDefault(line);
    } else if (what == "hub") {
        WrittenHub hub;
        hub.bus = line.number<std::uint32_t>();
        hub.inode = line.number<std::uint64_t>();
        hub.value = takeDefault(line);
        record.gate.hubs.push_back(hub);
    } else if (what == "device") {
        KnownDevice device;
        device.attachment.port = line.word();
        device.attachment.number = line.number<std::uint32_t>();
        device.attachment.inode = line.number<std::uint64_t>();
        device.standing = line.named(kStandings);
        device.since = BootTime(line.number<BootTime::rep>());
        device.confirmed = line.named(kConfirmations);
        record.gate.devices.push_back(std::move(device));
    } else {
        return false;
    }
    return line.isDone();
}

} // namespace

std::string_view nameOf(Standing standing) {
    return nameIn(kStandings, standing);
}

std::optional<Standing> standingNamed(std::string_view name) {
    return valueIn(kStandings, name);
}

std::string encodeGateRecord(const GateRecord& record) {
    std::string text =
        base::concat(kGateHead, "\nphase ", nameIn(kPhases, record.gate.phase), '\n');
    if (record.service.restricted) {
        text += "restricted\n";
    }
    if (record.service.starting) {
        text += "starting\n";
    }
    if (record.service.openUntil) {
        text +=
            base::concat("open-until ", std::to_string(record.service.openUntil->count()), '\n');
    }
    if (record.gate.parameter) {
        text += base::concat("parameter ", words(*record.gate.parameter), '\n');
    }
    for (const WrittenHub& hub : record.gate.hubs) {
        text += base::concat("hub ", std::to_string(hub.bus), ' ', std::to_string(hub.inode), ' ',
                             words(hub.value), '\n');
    }
    for (const KnownDevice& device : record.gate.devices) {
        text += base::concat("device ", device.attachment.port, ' ',
                             std::to_string(device.attachment.number), ' ',
                             std::to_string(device.attachment.inode), ' ', nameOf(device.standing),
                             ' ', std::to_string(device.since.count()), ' ',
                             nameIn(kConfirmations, device.confirmed), '\n');
    }
    return text += base::concat(kEnd, '\n');
}

std::optional<GateRecord> decodeGateRecord(std::string_view text) {
    GateRecord record;
    const bool taken =
        takeLines(text, kGateHead, [&](Line line) { return takeGateLine(record, line); });
    // One text for one record: nothing said twice, nothing in another order.
    return taken && encodeGateRecord(record) == text ? std::optional(std::move(record))
                                                     : std::nullopt;
}

KnownAcrossStarts acrossStarts(const UsbDevice& device) {
    const std::string& port = device.port();
    return {.controller = device.controller,
            .path = port.substr(std::min(port.find('-'), port.size() - 1) + 1),
            .vendor = device.vendor,
            .product = device.product,
            .descriptorsHash = device.descriptorsHash,
            .serial = device.serial};
}

std::string encodeKnownDevices(const KnownDevices& devices) {
    std::string text = base::concat(kDevicesHead, '\n');
    for (const KnownAcrossStarts& device : devices) {
        text +=
            base::concat("device ", hex(device.controller), ' ', device.path, ' ',
                         std::to_string(device.vendor), ' ', std::to_string(device.product), ' ',
                         std::to_string(device.descriptorsHash), ' ', hex(device.serial), '\n');
    }
    return text += base::concat(kEnd, '\n');
}

std::optional<KnownDevices> decodeKnownDevices(std::string_view text) {
    KnownDevices devices;
    const bool taken = takeLines(text, kDevicesHead, [&](Line line) {
        KnownAcrossStarts device;
        const bool isDevice = line.word() == "device";
        device.controller = line.bytes();
        device.path = line.word();
        device.vendor = line.number<std::uint16_t>();
        device.product = line.number<std::uint16_t>();
        device.descriptorsHash = line.number<std::uint64_t>();
        device.serial = line.bytes();
        devices.insert(std::move(device));
        return isDevice && line.isDone();
    });
    return taken && encodeKnownDevices(devices) == text ? std::optional(std::move(devices))
                                                        : std::nullopt;
}

} // namespace keystrand::usb
