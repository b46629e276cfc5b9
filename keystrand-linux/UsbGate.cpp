#include "keystrand-linux/UsbGate.h"

#include "base/Concat.h"
#include "base/Digits.h"

#include <algorithm>
#include <span>
#include <utility>

namespace keystrand::usb {

namespace {

using Kind = GateAction::Kind;

/// Enough for hubs within hubs within hubs; more is a bus that never comes to rest, which is looked
/// at again with its next event.
constexpr int kMostRounds = 64;

/// Until a bus that could not be looked at is looked at again.
constexpr BootTime kBlindTime = std::chrono::minutes(1);

/// So long, and once more for what the kernel did not take, something may come late.
constexpr BootTime kRestoreTime = 2 * GatePolicy::kLateTime;

/// So long a refused device is waited for that has not said all.
constexpr BootTime kNameTime = std::chrono::seconds(2);

/// So long a start of the machine waits for what devices say.
constexpr BootTime kSetUpTime = std::chrono::seconds(5);

/// More than fit into a line nobody wants to read.
constexpr std::size_t kMostClasses = 50;

std::string hexOfTwoBytes(std::uint16_t number) {
    const std::uint8_t bytes[] = {static_cast<std::uint8_t>(number >> 8U),
                                  static_cast<std::uint8_t>(number)};
    return base::hexDigits(bytes);
}

std::string quoted(const std::string& text) {
    std::string quoted = "\"";
    for (const char each : text) {
        const auto byte = static_cast<std::uint8_t>(each);
        const bool isPlain = byte >= 0x20 && byte < 0x7F && each != '"' && each != '\\';
        quoted += isPlain ? std::string(1, each) : base::concat("\\x", base::hexDigits({&byte, 1}));
    }
    return quoted + '"';
}

std::string listOf(const std::vector<std::string>& parts) {
    std::string list;
    for (const std::string& part : parts) {
        list += base::concat(list.empty() ? "" : ", ", part);
    }
    return list;
}

std::string_view reasonFor(Standing standing) {
    switch (standing) {
    case Standing::returned:
        return "it was attached when the machine went off";
    case Standing::keyboard:
        return "no other keyboard is attached";
    case Standing::probe:
        return "for a few seconds, to look for a keyboard behind it";
    case Standing::administrator:
        return "an administrator said so";
    default:
        return "the gate is open again";
    }
}

/// Whether there is a device that has not said all.
bool isBusy(const BusView& view) {
    return std::any_of(view.devices.begin(), view.devices.end(),
                       [](const UsbDevice& device) { return !device.saidAll; });
}

} // namespace

std::string classesOf(const UsbFunctions& functions, char between) {
    std::string text;
    const std::size_t count = std::min(functions.classes.size(), kMostClasses);
    for (const UsbClass& each : std::span(functions.classes).first(count)) {
        text += base::concat(text.empty() ? std::string() : std::string(1, between),
                             base::hexDigits({&each.number, 1}), '/',
                             base::hexDigits({&each.subclass, 1}), '/',
                             base::hexDigits({&each.protocol, 1}));
    }
    return text;
}

std::string describe(const UsbDevice& device) {
    std::string text = base::concat(
        device.port(), " (", hexOfTwoBytes(device.vendor), ':', hexOfTwoBytes(device.product), ' ',
        device.saidAll ? base::concat(quoted(device.manufacturer), ' ', quoted(device.name))
                       : "busy");
    if (!device.serial.empty()) {
        text += base::concat(", serial ", quoted(device.serial));
    }
    return text + (device.functions.understood
                       ? base::concat(", classes ", classesOf(device.functions, ' '), ')')
                       : std::string(", unknown)"));
}

UsbGate::UsbGate(Parts parts, GateRules rules)
    : parts_(std::move(parts)), policy_(std::move(rules)) {}

UsbGate::~UsbGate() {
    parts_.bus.watch(nullptr);
}

std::optional<GateRecord> UsbGate::resume() {
    std::string problem;
    const auto text = parts_.record.read(problem);
    auto record = text ? decodeGateRecord(*text) : std::nullopt;
    if (!record && (text || !problem.empty())) {
        parts_.log.write(
            GateLine::recordFailed,
            base::concat("keystrand: ",
                         problem.empty()
                             ? base::concat(parts_.record.path(), ": not a record of the gate")
                             : problem,
                         "; what is attached counts as accepted, and what reads closed stays so: "
                         "keystrand --restore --all opens it"));
    }
    record_ = record.value_or(GateRecord{.replacesLost = text || !problem.empty()});
    toldClosed_ = record_.gate.phase != GateState::Phase::open;
    savedRecord_ = record ? *text : std::string();
    policy_.resume(record_.gate);
    watchAsNeeded();
    return record;
}

void UsbGate::setClosed(bool closed) {
    wantsClosed_ = closed;
    if (closed != policy_.closed()) {
        toldFailures_.clear();
    }
    if (!closed && policy_.state().phase != GateState::Phase::open) {
        // Also what an earlier service had begun.
        policy_.open();
        settle();
    } else if (closed && !policy_.closed()) {
        if (const auto view = lookAtBus(&UsbBus::glance)) {
            // First of all what is there now: whatever comes from here on is new.
            policy_.close(*view, parts_.now());
            watchAsNeeded();
            settle();
        } else {
            parts_.rearm();
        }
    } else if (closed && !hasSettled_) {
        // An earlier service has closed it; what came since is looked at like new.
        settle();
    }
    watchAsNeeded();
}

void UsbGate::setLocked(bool locked) {
    const bool isNews = std::exchange(locked_, locked) != locked;
    watchAsNeeded();
    if (isNews && locked_ && !policy_.closed()) {
        look();
    }
}

void UsbGate::keepDevices() {
    keepsDevices_ = true;
    if (const auto view = locked_ || policy_.closed() ? lookAtBus() : std::nullopt) {
        saveDevices(*view);
    }
}

void UsbGate::remember(const GateRecord::Service& service) {
    record_.service = service;
    save();
}

void UsbGate::keepOnlyKnown() {
    std::string problem;
    const auto text = parts_.devices.read(problem);
    const auto known = text ? decodeKnownDevices(*text) : std::nullopt;
    if (!known) {
        parts_.log.write(
            GateLine::recordFailed,
            base::concat("keystrand: ",
                         !problem.empty()
                             ? problem
                             : base::concat(parts_.devices.path(),
                                            text ? ": not a list of devices" : ": there is none"),
                         "; what is attached counts as accepted"));
        return;
    }
    auto view = lookAtBus();
    // One that has not said all is not known. The kernel sets up what it has just found.
    const BootTime end = parts_.now() + kSetUpTime;
    for (int again = 0; again < kMostRounds && view && isBusy(*view) && parts_.now() < end;
         ++again) {
        view = lookAtBus();
    }
    if (view) {
        policy_.keepOnly(
            [known = *known](const UsbDevice& device) {
                return device.saidAll && known.contains(acrossStarts(device));
            },
            *view, parts_.now());
        settle();
    }
}

std::optional<std::string> UsbGate::accept(const Attachment& attachment) {
    const auto view = lookAtBus();
    const UsbDevice* const found = view ? view->find(attachment) : nullptr;
    if (found == nullptr) {
        return "the device is not there any more";
    }
    if (found->authorized) {
        return "the device is accepted already";
    }
    if (policy_.accept(attachment, parts_.now())) {
        settle();
    } else {
        const GateAction action{
            .kind = Kind::accept, .hub = {}, .device = *found, .standing = Standing::administrator};
        tell(action, parts_.bus.accept(*found));
    }
    const auto after = lookAtBus();
    const UsbDevice* const now = after ? after->find(attachment) : nullptr;
    return now != nullptr && now->authorized
               ? std::nullopt
               : std::optional<std::string>("the device could not be accepted");
}

void UsbGate::look() {
    if (wantsClosed_ && !policy_.closed()) {
        // It was not to be seen until now.
        setClosed(true);
    } else if (policy_.state().phase != GateState::Phase::open) {
        settle();
        watchAsNeeded();
    } else if (locked_) {
        if (const auto view = lookAtBus()) {
            saveDevices(*view);
        }
        parts_.rearm();
    }
}

void UsbGate::takeOver() {
    if (const auto view = lookAtBus()) {
        policy_.takeOver(*view, parts_.now());
        watchAsNeeded();
    }
}

bool UsbGate::restore(const Wait& wait) {
    const BootTime end = parts_.now() + kRestoreTime;
    setClosed(false);
    while (policy_.state().phase != GateState::Phase::open && parts_.now() < end) {
        wait(std::min(nextLook().value_or(end), end));
        look();
    }
    std::vector<std::string> left = policy_.gaps();
    const BusView view = lookAtBus(&UsbBus::glance).value_or(BusView());
    for (const UsbDevice& device : view.devices) {
        if (!device.authorized && notAccepted_.contains(device.attachment)) {
            left.push_back(base::concat("device ", device.port()));
        }
    }
    const std::string gap = listOf(left);
    if (!toldProblem_.empty()) {
        parts_.log.write(GateLine::writeFailed,
                         base::concat("keystrand: cannot open the gate: ", toldProblem_));
    } else if (!gap.empty() && gap != toldGap_) {
        parts_.log.write(GateLine::opened,
                         base::concat("keystrand: the gate is open, but for ", gap));
    }
    return toldProblem_.empty() && gap.empty();
}

std::string UsbGate::closedByNobodyKnows() {
    const bool isToBeOpen = !wantsClosed_ && policy_.isPutBack();
    const auto view =
        record_.replacesLost && isToBeOpen ? lookAtBus(&UsbBus::glance) : std::nullopt;
    std::vector<std::string> closed;
    if (view && view->hasUsb) {
        if (isClosed(view->parameter)) {
            closed.emplace_back("the parameter authorized_default");
        }
        for (const RootHub& hub : view->rootHubs) {
            if (isClosed(hub.authorizedDefault)) {
                closed.push_back(base::concat("root hub usb", std::to_string(hub.bus)));
            }
        }
    }
    return listOf(closed);
}

std::vector<UsbGate::Listed> UsbGate::list() {
    std::vector<Listed> listed;
    const BusView view = lookAtBus().value_or(BusView());
    listed.reserve(view.devices.size());
    for (const UsbDevice& device : view.devices) {
        const KnownDevice* const known = isOpen() ? nullptr : policy_.find(device.attachment);
        listed.push_back({.device = device,
                          .standing = known ? std::optional(known->standing) : std::nullopt,
                          .since = known ? known->since : BootTime(0)});
    }
    return listed;
}

std::size_t UsbGate::countRefused() {
    const BusView view = lookAtBus(&UsbBus::glance).value_or(BusView());
    return static_cast<std::size_t>(
        std::count_if(view.devices.begin(), view.devices.end(),
                      [](const UsbDevice& device) { return !device.authorized; }));
}

std::string UsbGate::gap() const {
    return wantsClosed_ && !toldProblem_.empty() ? toldProblem_ : listOf(policy_.gaps());
}

std::optional<BootTime> UsbGate::nextLook() const {
    auto next = policy_.nextLook();
    const bool isDone = policy_.state().phase == GateState::Phase::open && !wantsClosed_;
    if (busyAt_ && (locked_ || !isDone)) {
        const BootTime again = *busyAt_ + GatePolicy::kRetryTime;
        next = std::min(next.value_or(again), again);
    }
    if (!blindSince_ || isDone) {
        return next;
    }
    return std::max(next.value_or(*blindSince_ + kBlindTime),
                    *blindSince_ + GatePolicy::kRetryTime);
}

std::optional<BusView> UsbGate::lookAtBus(Look at) {
    std::string problem;
    auto view = (parts_.bus.*at)(problem);
    if (!problem.empty() && problem != toldProblem_) {
        parts_.log.write(GateLine::cannotGuard,
                         base::concat("keystrand: no port is guarded: ", problem));
    }
    toldProblem_ = problem;
    blindSince_ = view ? std::nullopt : std::optional(parts_.now());
    if (at == &UsbBus::look) {
        busyAt_ = view && isBusy(*view) ? std::optional(parts_.now()) : std::nullopt;
    }
    return view;
}

void UsbGate::settle() {
    hasSettled_ = true;
    // A write may be told to be an event before it has returned.
    if (std::exchange(settling_, true)) {
        return;
    }
    for (int round = 0; round < kMostRounds && step(); ++round) {
    }
    settling_ = false;
    save();
    tellState();
    watchAsNeeded();
    parts_.rearm();
}

bool UsbGate::step() {
    const BootTime now = parts_.now();
    if (policy_.closed()) {
        // What devices say may take as long as they like.
        const auto glance = lookAtBus(&UsbBus::glance);
        if (!glance || carryOut(policy_.decideDefaults(*glance, now), now)) {
            return glance.has_value();
        }
    }
    auto view = lookAtBus();
    // What is refused anyway can wait for its names to be told.
    for (int again = 0; again < kMostRounds && view && policy_.closed() && awaitsNames(*view) &&
                        parts_.now() < now + kNameTime;
         ++again) {
        view = lookAtBus();
    }
    if (!view) {
        policy_.endLate(now);
        return false;
    }
    const auto actions = policy_.decide(*view, now);
    if (actions.empty() && (locked_ || policy_.closed())) {
        saveDevices(*view);
    }
    return carryOut(actions, now);
}

/// Whether something new has not said all, and nothing new is in that would have to go at once.
bool UsbGate::awaitsNames(const BusView& view) const {
    bool awaits = false;
    for (const UsbDevice& device : view.devices) {
        const bool isNew = policy_.find(device.attachment) == nullptr;
        if (isNew && device.authorized) {
            return false;
        }
        awaits = awaits || (isNew && !device.saidAll);
    }
    return awaits;
}

bool UsbGate::carryOut(const std::vector<GateAction>& actions, BootTime now) {
    save();
    for (const GateAction& action : actions) {
        const GateOutcome outcome = carryOut(action);
        policy_.carriedOut(action, outcome, now);
        tell(action, outcome);
    }
    return !actions.empty();
}

/// The gate is what was read back, not what was wished.
void UsbGate::tellState() {
    const bool closes = policy_.closed();
    std::string gap = listOf(policy_.gaps());
    if (closes ? !toldProblem_.empty() : !policy_.isPutBack() && gap.empty()) {
        // Nobody knows yet.
        return;
    }
    if (toldClosed_ == closes && toldGap_ == gap) {
        return;
    }
    toldClosed_ = closes;
    toldGap_ = std::move(gap);
    const std::string exceptions =
        toldGap_.empty() ? std::string() : base::concat(", but for ", toldGap_);
    if (closes) {
        parts_.log.write(GateLine::closed, "keystrand: the gate is closed" + exceptions);
    } else {
        parts_.log.write(GateLine::opened, "keystrand: the gate is open" + exceptions);
    }
}

GateOutcome UsbGate::carryOut(const GateAction& action) {
    switch (action.kind) {
    case Kind::setParameter:
        return parts_.bus.setParameter(action.value);
    case Kind::setRootHub:
        return parts_.bus.setRootHub(action.hub, action.value);
    case Kind::accept:
        return parts_.bus.accept(action.device);
    case Kind::refuse:
        return parts_.bus.refuse(action.device);
    case Kind::stayOut:
        return {};
    }
    return {};
}

void UsbGate::tell(const GateAction& action, const GateOutcome& outcome) {
    if (action.kind != Kind::setParameter && action.kind != Kind::setRootHub) {
        tellDevice(action, outcome);
        return;
    }
    if (outcome.kind == GateOutcome::Kind::vanished) {
        return;
    }
    const bool isParameter = action.kind == Kind::setParameter;
    const std::string what = isParameter
                                 ? "the parameter authorized_default"
                                 : base::concat("root hub usb", std::to_string(action.hub.bus));
    if (outcome.kind == GateOutcome::Kind::done && outcome.readBack == action.value) {
        return;
    }
    if (outcome.kind == GateOutcome::Kind::failed) {
        tellFailure(base::concat("keystrand: ", what, " cannot be set to ",
                                 std::to_string(action.value), ": ", outcome.reason));
    } else {
        tellFailure(base::concat("keystrand: ", what, " was set to ", std::to_string(action.value),
                                 " and reads ", std::to_string(outcome.readBack)));
    }
}

void UsbGate::tellFailure(const std::string& line) {
    if (toldFailures_.insert(line).second) {
        parts_.log.write(GateLine::writeFailed, line);
    }
}

void UsbGate::tellDevice(const GateAction& action, const GateOutcome& outcome) {
    const std::string device = describe(action.device);
    const bool isAccepted = action.kind == Kind::accept;
    if (isAccepted && outcome.kind == GateOutcome::Kind::failed) {
        notAccepted_.insert(action.device.attachment);
    }
    switch (outcome.kind) {
    case GateOutcome::Kind::done:
        parts_.log.write(isAccepted ? GateLine::accepted : GateLine::refused,
                         isAccepted ? base::concat("keystrand: accepted ", device, ": ",
                                                   reasonFor(action.standing))
                                    : base::concat("keystrand: refused ", device));
        return;
    case GateOutcome::Kind::inUse:
        parts_.log.write(GateLine::left,
                         base::concat("keystrand: left ", device, ": in use: ", outcome.reason));
        return;
    case GateOutcome::Kind::failed:
        tellFailure(base::concat("keystrand: cannot ", isAccepted ? "accept " : "refuse ", device,
                                 ": ", outcome.reason));
        return;
    case GateOutcome::Kind::vanished:
        return;
    }
}

void UsbGate::save() {
    record_.gate = policy_.state();
    const std::string text = encodeGateRecord(record_);
    if (text == savedRecord_) {
        return;
    }
    std::string problem;
    if (!parts_.record.replace(text, problem)) {
        // The gate closes all the same; only the next service knows less.
        parts_.log.write(GateLine::recordFailed, base::concat("keystrand: ", problem));
    }
    savedRecord_ = text;
}

void UsbGate::saveDevices(const BusView& view) {
    if (!keepsDevices_) {
        return;
    }
    KnownDevices known;
    for (const UsbDevice& device : view.devices) {
        const KnownDevice* const entry = policy_.find(device.attachment);
        if (device.authorized && device.saidAll && (entry == nullptr || isIn(entry->standing))) {
            known.insert(acrossStarts(device));
        }
    }
    std::string text = encodeKnownDevices(known);
    if (text == savedDevices_) {
        return;
    }
    std::string problem;
    if (!parts_.devices.replace(text, problem)) {
        parts_.log.write(GateLine::recordFailed, base::concat("keystrand: ", problem));
    }
    savedDevices_ = std::move(text);
}

void UsbGate::watchAsNeeded() {
    // Nothing wakes the service while the gate is open and nobody will ask what was attached.
    const bool wanted = locked_ || wantsClosed_ || policy_.state().phase != GateState::Phase::open;
    if (wanted == watching_) {
        return;
    }
    watching_ = wanted;
    if (wanted) {
        parts_.bus.watch([this] { look(); });
    } else {
        parts_.bus.watch(nullptr);
    }
}

} // namespace keystrand::usb
