#include "keystrand-linux/GateRecord.h"

#include "base/Concat.h"
#include "base/LineWords.h"

#include <algorithm>
#include <array>
#include <utility>

namespace keystrand::usb {

namespace {

constexpr std::string_view kGateHead = "keystrand-gate 1";
constexpr std::string_view kDevicesHead = "keystrand-devices 1";
constexpr std::string_view kEnd = "end";

constexpr std::array<std::pair<Standing, std::string_view>, 11> kStandings = {{
    {Standing::attached, "attached"},
    {Standing::returned, "returned"},
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

using base::LineWords;

/// The next word, which the table has.
template <typename Table>
auto named(LineWords& line, const Table& table) {
    const auto value = valueIn(table, line.word());
    line.require(value.has_value());
    return value.value_or(table.front().first);
}

/// Whether the text is the head, lines each of which `take` understands, and the end.
template <typename Take>
bool takeLines(std::string_view text, std::string_view head, Take take) {
    const auto lines = base::linesOf(text);
    return lines && lines->size() >= 2 && lines->front() == head && lines->back() == kEnd &&
           std::all_of(lines->begin() + 1, lines->end() - 1,
                       [&take](std::string_view line) { return take(LineWords(line)); });
}

std::string words(const WrittenDefault& value) {
    return base::concat(std::to_string(value.before), ' ', std::to_string(value.written), ' ',
                        nameIn(kConfirmations, value.confirmed));
}

WrittenDefault takeDefault(LineWords& line) {
    WrittenDefault value;
    value.before = line.number<AuthorizedDefault>();
    value.written = line.number<AuthorizedDefault>();
    value.confirmed = named(line, kConfirmations);
    return value;
}

bool takeGateLine(GateRecord& record, LineWords line) {
    const std::string_view what = line.word();
    if (what == "phase") {
        record.gate.phase = named(line, kPhases);
    } else if (what == "restricted") {
        record.service.restricted = true;
    } else if (what == "starting") {
        record.service.starting = true;
    } else if (what == "replaces-lost") {
        record.replacesLost = true;
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
        device.standing = named(line, kStandings);
        device.since = BootTime(line.number<BootTime::rep>());
        device.confirmed = named(line, kConfirmations);
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
    if (record.replacesLost) {
        text += "replaces-lost\n";
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
        takeLines(text, kGateHead, [&](LineWords line) { return takeGateLine(record, line); });
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
        text += base::concat("device ", base::hexWord(device.controller), ' ', device.path, ' ',
                             std::to_string(device.vendor), ' ', std::to_string(device.product),
                             ' ', std::to_string(device.descriptorsHash), ' ',
                             base::hexWord(device.serial), '\n');
    }
    return text += base::concat(kEnd, '\n');
}

std::optional<KnownDevices> decodeKnownDevices(std::string_view text) {
    KnownDevices devices;
    const bool taken = takeLines(text, kDevicesHead, [&](LineWords line) {
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
