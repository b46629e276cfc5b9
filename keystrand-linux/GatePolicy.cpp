#include "keystrand-linux/GatePolicy.h"

#include <algorithm>
#include <charconv>

namespace keystrand::usb {

namespace {

using Kind = GateAction::Kind;
using Phase = GateState::Phase;

/// Whether devices that come are decided at least as strictly at `value` as at `wanted`.
bool isAsStrict(AuthorizedDefault value, AuthorizedDefault wanted) {
    return value == kNobody || value == wanted;
}

bool letsIn(AuthorizedDefault value, const UsbDevice& device) {
    return value == kEverybody || (value == kHardWiredOnly && device.hardWired);
}

template <typename Each>
bool isAmong(const std::vector<Each>& all, const Each& one) {
    return std::find(all.begin(), all.end(), one) != all.end();
}

const RootHub* rootHubOf(const BusView& view, const UsbDevice& device) {
    const std::uint32_t bus = busOf(device.port());
    const auto found = std::find_if(view.rootHubs.begin(), view.rootHubs.end(),
                                    [&](const RootHub& hub) { return hub.bus == bus; });
    return found == view.rootHubs.end() ? nullptr : &*found;
}

/// For a root hub that came closed because of the parameter: what it would have been otherwise.
std::optional<AuthorizedDefault> valueWithout(const std::optional<WrittenDefault>& parameter,
                                              const RootHub& hub) {
    if (!parameter || !parameter->isStillThere(hub.authorizedDefault)) {
        return std::nullopt;
    }
    return parameter->before == kAsTheControllerHasIt ? kEverybody : parameter->before;
}

GateAction forParameter(AuthorizedDefault value) {
    return {.kind = Kind::setParameter, .value = value, .hub = {}, .device = {}};
}

GateAction forHub(const RootHub& hub, AuthorizedDefault value) {
    return {.kind = Kind::setRootHub, .value = value, .hub = hub, .device = {}};
}

GateAction forDevice(Kind kind, const UsbDevice& device, Standing standing) {
    return {.kind = kind, .hub = {}, .device = device, .standing = standing};
}

} // namespace

std::uint32_t busOf(std::string_view port) {
    std::uint32_t bus = 0;
    const auto [end, error] = std::from_chars(port.data(), port.data() + port.size(), bus);
    const bool isPort = error == std::errc() && end != port.data() + port.size() && *end == '-';
    return isPort ? bus : 0;
}

const UsbDevice* BusView::find(const Attachment& attachment) const {
    const auto found = std::find_if(devices.begin(), devices.end(), [&](const UsbDevice& device) {
        return device.attachment == attachment;
    });
    return found == devices.end() ? nullptr : &*found;
}

GatePolicy::GatePolicy(GateRules rules)
    : rules_(std::move(rules)), closing_(rules_.internal ? kHardWiredOnly : kNobody) {}

void GatePolicy::resume(GateState state) {
    state_ = std::move(state);
    // What was being let in while opening has still to be let in; anything else is looked at as if
    // it had just come.
    if (closed()) {
        std::erase_if(state_.devices, [](const KnownDevice& known) { return !known.confirmed; });
    }
}

void GatePolicy::close(const BusView& view, BootTime now) {
    if (closed()) {
        return;
    }
    // One that is closed already was closed by somebody else, unless it came while the gate opened.
    const std::optional<WrittenDefault> parameter = late_ ? late_->parameter : state_.parameter;
    for (const RootHub& hub : view.rootHubs) {
        if (hubAt(hub.inode) == nullptr) {
            remember(hub, valueOfLate(hub, parameter).value_or(hub.authorizedDefault));
        }
    }
    state_.phase = Phase::closed;
    putBack_.clear();
    late_.reset();
    // What was put back while the gate was opening has to be written once more.
    if (state_.parameter && state_.parameter->written != view.parameter) {
        state_.parameter.reset();
    }
    for (const UsbDevice& device : view.devices) {
        if (entryOf(device.attachment) == state_.devices.end()) {
            state_.devices.push_back(
                {.attachment = device.attachment,
                 .standing = device.authorized ? Standing::attached : Standing::refusedByOthers,
                 .since = now});
        }
    }
}

void GatePolicy::open() {
    if (closed()) {
        state_.phase = Phase::opening;
    }
}

void GatePolicy::keepOnly(const IsKnown& isKnown, const BusView& view, BootTime now) {
    for (const UsbDevice& device : view.devices) {
        const auto entry = entryOf(device.attachment);
        if (entry == state_.devices.end() || entry->standing != Standing::attached ||
            device.hardWired || isKnown(device) ||
            (device.functions.isOnlyKeyboard && !isNoKeyboard(device))) {
            continue;
        }
        entry->standing = Standing::refused;
        entry->confirmed = false;
        entry->since = now - kRetryTime;
    }
}

bool GatePolicy::accept(const Attachment& attachment, BootTime now) {
    const auto entry = entryOf(attachment);
    if (entry == state_.devices.end() || isIn(entry->standing)) {
        return false;
    }
    entry->standing = Standing::administrator;
    entry->confirmed = false;
    entry->since = now - kRetryTime;
    return true;
}

std::vector<GateAction> GatePolicy::decide(const BusView& view, BootTime now) {
    forgetWhatWent(view);
    switch (state_.phase) {
    case Phase::open:
        return decideOpen(view, now);
    case Phase::closed:
        return decideClosed(view, now);
    case Phase::opening:
        return decideOpening(view, now);
    }
    return {};
}

void GatePolicy::forgetWhatWent(const BusView& view) {
    std::erase_if(state_.devices,
                  [&](const KnownDevice& known) { return view.find(known.attachment) == nullptr; });
    std::erase_if(state_.hubs, [&](const WrittenHub& known) {
        return std::none_of(view.rootHubs.begin(), view.rootHubs.end(),
                            [&](const RootHub& hub) { return hub.inode == known.inode; });
    });
}

GatePolicy::Actions GatePolicy::decideClosed(const BusView& view, BootTime now) {
    // First the defaults: what comes after them is refused by the kernel.
    Actions actions = closeDefaults(view);
    if (!actions.empty()) {
        return actions;
    }
    for (const UsbDevice& device : view.devices) {
        const auto entry = entryOf(device.attachment);
        auto action = entry == state_.devices.end() ? decideNew(device, view, now)
                                                    : decideKnown(*entry, device, view, now);
        if (action) {
            actions.push_back(std::move(*action));
        }
    }
    return actions;
}

GatePolicy::Actions GatePolicy::closeDefaults(const BusView& view) {
    Actions actions;
    if (!state_.parameter) {
        state_.parameter = WrittenDefault{.before = view.parameter, .written = closing_};
        if (isAsStrict(view.parameter, closing_)) {
            state_.parameter = WrittenDefault{
                .before = view.parameter, .written = view.parameter, .confirmed = true};
        }
    }
    if (!state_.parameter->confirmed) {
        actions.push_back(forParameter(state_.parameter->written));
    }
    for (const RootHub& hub : view.rootHubs) {
        if (hubAt(hub.inode) == nullptr) {
            remember(hub, valueWithout(state_.parameter, hub).value_or(hub.authorizedDefault));
        }
        const WrittenHub* const known = hubAt(hub.inode);
        if (!known->value.confirmed) {
            actions.push_back(forHub(hub, known->value.written));
        }
    }
    return actions;
}

void GatePolicy::remember(const RootHub& hub, AuthorizedDefault before) {
    const bool isClosed = isAsStrict(hub.authorizedDefault, closing_);
    state_.hubs.push_back({.bus = hub.bus,
                           .inode = hub.inode,
                           .value = {.before = before,
                                     .written = isClosed ? hub.authorizedDefault : closing_,
                                     .confirmed = isClosed}});
}

std::optional<GateAction> GatePolicy::decideKnown(KnownDevice& known, const UsbDevice& device,
                                                  const BusView& view, BootTime now) {
    if (!known.confirmed) {
        if (now < known.since + kRetryTime) {
            return std::nullopt;
        }
        if (!isIn(known.standing)) {
            return refuse(known, device, view, now);
        }
        known.since = now;
        return forDevice(Kind::accept, device, known.standing);
    }
    switch (known.standing) {
    case Standing::refused:
        if (device.authorized) {
            // Only root can have done that.
            known.standing = Standing::letInByOthers;
            known.since = now;
        } else if (mayBeTheKeyboard(device) && wantsKeyboard(view)) {
            known = {.attachment = device.attachment,
                     .standing = Standing::keyboard,
                     .since = now,
                     .confirmed = false};
            return forDevice(Kind::accept, device, Standing::keyboard);
        }
        return std::nullopt;
    case Standing::probe:
    case Standing::keyboardHub:
        return decideProbe(known, device, view, now);
    default:
        return std::nullopt;
    }
}

std::optional<GateAction> GatePolicy::decideProbe(KnownDevice& known, const UsbDevice& device,
                                                  const BusView& view, BootTime now) {
    if (keyboardBehind(device, view)) {
        known.standing = Standing::keyboardHub;
        return std::nullopt;
    }
    if (known.standing == Standing::keyboardHub) {
        known.standing = Standing::probe;
        known.since = now;
    }
    if (now < known.since + kProbeTime) {
        return std::nullopt;
    }
    return refuse(known, device, view, now);
}

std::optional<GateAction> GatePolicy::decideNew(const UsbDevice& device, const BusView& view,
                                                BootTime now) {
    state_.devices.push_back(
        {.attachment = device.attachment, .standing = Standing::refused, .since = now});
    KnownDevice& known = state_.devices.back();
    if (isLetInByItsPort(device)) {
        known.standing = Standing::hardWired;
        return std::nullopt;
    }
    const bool wanted = !isClosedByOthers(device) && wantsKeyboard(view);
    if (wanted && (mayBeTheKeyboard(device) || device.functions.isHub)) {
        known.standing = device.functions.isHub ? Standing::probe : Standing::keyboard;
        // One that came in while the gate was closing is in already; it is told all the same.
        known.confirmed = false;
        return forDevice(Kind::accept, device, known.standing);
    }
    if (device.authorized) {
        return refuse(known, device, view, now);
    }
    return forDevice(Kind::stayOut, device, Standing::refused);
}

std::optional<GateAction> GatePolicy::refuse(KnownDevice& known, const UsbDevice& device,
                                             const BusView& view, BootTime now) {
    known.since = now;
    if (device.functions.isHub && keyboardBehind(device, view)) {
        known.standing = Standing::keyboardHub;
        known.confirmed = true;
        return std::nullopt;
    }
    known.standing = Standing::refused;
    known.confirmed = false;
    return forDevice(Kind::refuse, device, Standing::refused);
}

GatePolicy::Actions GatePolicy::decideOpening(const BusView& view, BootTime now) {
    takeInWhatCameLast(view);
    Actions actions = putDefaultsBack(view);
    if (!actions.empty()) {
        return actions;
    }
    if (rules_.onUnlock == OnUnlock::accept) {
        // Behind a refused hub nothing is seen: hubs first.
        actions = letIn(view, true);
        if (actions.empty()) {
            actions = letIn(view, false);
        }
    }
    if (actions.empty()) {
        late_ =
            Late{.until = now + kLateTime, .parameter = state_.parameter, .hubs = {}, .seen = {}};
        for (const RootHub& hub : view.rootHubs) {
            late_->hubs.push_back(hub.inode);
        }
        for (const UsbDevice& device : view.devices) {
            late_->seen.push_back(device.attachment);
        }
        state_ = {};
    }
    return actions;
}

void GatePolicy::endLate(BootTime now) {
    if (late_ && now >= late_->until) {
        late_.reset();
        putBack_.clear();
    }
}

GatePolicy::Actions GatePolicy::decideOpen(const BusView& view, BootTime now) {
    Actions actions;
    endLate(now);
    if (!late_) {
        return actions;
    }
    for (const RootHub& hub : view.rootHubs) {
        if (const auto before = valueOfLate(hub, late_->parameter)) {
            actions.push_back(forHub(hub, *before));
        }
    }
    for (const UsbDevice& device : view.devices) {
        const RootHub* const root = rootHubOf(view, device);
        // One that is seen let in, and refused later, is somebody else's.
        if (isAmong(late_->seen, device.attachment) || root == nullptr || !isPutBack(*root)) {
            continue;
        }
        late_->seen.push_back(device.attachment);
        if (!device.authorized && rules_.onUnlock == OnUnlock::accept &&
            letsIn(root->authorizedDefault, device)) {
            actions.push_back(forDevice(Kind::accept, device, Standing::attached));
        }
    }
    return actions;
}

/// For a root hub that came while the gate opened, and had read the parameter before that.
std::optional<AuthorizedDefault>
GatePolicy::valueOfLate(const RootHub& hub, const std::optional<WrittenDefault>& parameter) const {
    return isPutBack(hub) || (late_ && isAmong(late_->hubs, hub.inode))
               ? std::nullopt
               : valueWithout(parameter, hub);
}

/// What the kernel has refused on this service's behalf since the last look.
void GatePolicy::takeInWhatCameLast(const BusView& view) {
    for (const UsbDevice& device : view.devices) {
        const RootHub* const root = rootHubOf(view, device);
        if (!device.authorized && root != nullptr && find(device.attachment) == nullptr &&
            (valueBefore(*root) || isPutBack(*root))) {
            state_.devices.push_back(
                {.attachment = device.attachment, .standing = Standing::refused});
        }
    }
}

GatePolicy::Actions GatePolicy::putDefaultsBack(const BusView& view) const {
    Actions actions;
    if (state_.parameter && state_.parameter->isStillThere(view.parameter)) {
        actions.push_back(forParameter(state_.parameter->before));
    }
    for (const RootHub& hub : view.rootHubs) {
        if (const auto before = valueBefore(hub)) {
            actions.push_back(forHub(hub, *before));
        }
    }
    return actions;
}

/// What the root hub is to be again; none for one that reads something that this service did not
/// write: that is somebody else's by now.
std::optional<AuthorizedDefault> GatePolicy::valueBefore(const RootHub& hub) const {
    for (const WrittenHub& known : state_.hubs) {
        if (known.inode == hub.inode) {
            return known.value.isStillThere(hub.authorizedDefault)
                       ? std::optional(known.value.before)
                       : std::nullopt;
        }
    }
    return valueWithout(state_.parameter, hub);
}

GatePolicy::Actions GatePolicy::letIn(const BusView& view, bool hubs) {
    Actions actions;
    for (const UsbDevice& device : view.devices) {
        const auto entry = entryOf(device.attachment);
        const RootHub* const root = rootHubOf(view, device);
        const bool isOurs =
            entry != state_.devices.end() &&
            (entry->standing == Standing::refused || (isIn(entry->standing) && !entry->confirmed));
        if (isOurs && !device.authorized && device.functions.isHub == hubs && root != nullptr &&
            letsIn(root->authorizedDefault, device)) {
            actions.push_back(forDevice(Kind::accept, device, Standing::attached));
        }
    }
    return actions;
}

void GatePolicy::carriedOut(const GateAction& action, const GateOutcome& outcome, BootTime now) {
    switch (action.kind) {
    case Kind::setParameter:
        if (state_.phase == Phase::opening) {
            // A root hub that came before this write is closed because of the parameter, still.
            if (outcome.kind == GateOutcome::Kind::failed) {
                state_.parameter.reset();
            }
        } else if (state_.parameter) {
            defaultWritten(*state_.parameter, outcome);
        }
        return;
    case Kind::setRootHub:
        if (!closed()) {
            hubPutBack(action, outcome);
        } else if (WrittenHub* const known = hubAt(action.hub.inode)) {
            defaultWritten(known->value, outcome);
        }
        return;
    case Kind::accept:
    case Kind::refuse:
        deviceWritten(action, outcome, now);
        return;
    case Kind::stayOut:
        return;
    }
}

void GatePolicy::defaultWritten(WrittenDefault& value, const GateOutcome& outcome) {
    value.confirmed = true;
    // A kernel that knows only two values reads back the other one, without an error.
    if (outcome.kind == GateOutcome::Kind::done && outcome.readBack != value.written &&
        value.written == kHardWiredOnly) {
        closing_ = kNobody;
        value.written = kNobody;
        value.confirmed = false;
    }
}

void GatePolicy::hubPutBack(const GateAction& action, const GateOutcome& outcome) {
    std::erase_if(state_.hubs,
                  [&](const WrittenHub& known) { return known.inode == action.hub.inode; });
    putBack_.push_back(action.hub.inode);
    if (outcome.kind == GateOutcome::Kind::failed && state_.phase == Phase::opening) {
        // Not tried again: it would fail for ever.
        const WrittenDefault left{.before = action.hub.authorizedDefault,
                                  .written = action.hub.authorizedDefault,
                                  .confirmed = true};
        state_.hubs.push_back({.bus = action.hub.bus, .inode = action.hub.inode, .value = left});
    }
}

bool GatePolicy::isPutBack(const RootHub& hub) const {
    return isAmong(putBack_, hub.inode);
}

void GatePolicy::deviceWritten(const GateAction& action, const GateOutcome& outcome, BootTime now) {
    const auto entry = entryOf(action.device.attachment);
    if (entry == state_.devices.end()) {
        return;
    }
    const bool letIn = action.kind == Kind::accept;
    switch (outcome.kind) {
    case GateOutcome::Kind::vanished:
        state_.devices.erase(entry);
        return;
    case GateOutcome::Kind::inUse:
        entry->standing = Standing::inUse;
        break;
    case GateOutcome::Kind::done:
        entry->standing = action.standing;
        break;
    case GateOutcome::Kind::failed:
        if (!letIn) {
            // Tried again after a while.
            entry->since = now;
            return;
        }
        // Not tried again: it would fail for ever.
        entry->standing = Standing::refusedByOthers;
        break;
    }
    entry->confirmed = true;
    entry->since = now;
}

std::optional<BootTime> GatePolicy::nextLook() const {
    std::optional<BootTime> next;
    if (!closed()) {
        return late_ ? std::optional(late_->until) : next;
    }
    for (const KnownDevice& known : state_.devices) {
        std::optional<BootTime> at;
        if (!known.confirmed) {
            at = known.since + kRetryTime;
        } else if (known.standing == Standing::probe) {
            at = known.since + kProbeTime;
        }
        if (at && (!next || *at < *next)) {
            next = at;
        }
    }
    return next;
}

const KnownDevice* GatePolicy::find(const Attachment& attachment) const {
    const auto found =
        std::find_if(state_.devices.begin(), state_.devices.end(),
                     [&](const KnownDevice& known) { return known.attachment == attachment; });
    return found == state_.devices.end() ? nullptr : &*found;
}

bool GatePolicy::isNoKeyboard(const UsbDevice& device) const {
    return std::find(rules_.notKeyboards.begin(), rules_.notKeyboards.end(),
                     GateRules::Product{device.vendor, device.product}) !=
           rules_.notKeyboards.end();
}

bool GatePolicy::mayBeTheKeyboard(const UsbDevice& device) const {
    return device.functions.isOnlyKeyboard && !isNoKeyboard(device) && !isClosedByOthers(device);
}

bool GatePolicy::wantsKeyboard(const BusView& view) const {
    switch (rules_.keyboards) {
    case KeyboardRule::never:
        return false;
    case KeyboardRule::always:
        return true;
    case KeyboardRule::whenNone:
        return !rules_.keyboardBuiltIn &&
               std::none_of(view.devices.begin(), view.devices.end(),
                            [&](const UsbDevice& device) { return isKeyboardIn(device); });
    }
    return false;
}

/// Also one that has just been decided to be.
bool GatePolicy::isKeyboardIn(const UsbDevice& device) const {
    const KnownDevice* const known = find(device.attachment);
    return known != nullptr && isIn(known->standing) && device.functions.isKeyboard &&
           !isNoKeyboard(device) && (device.authorized || !known->confirmed);
}

bool GatePolicy::keyboardBehind(const UsbDevice& hub, const BusView& view) const {
    return std::any_of(view.devices.begin(), view.devices.end(), [&](const UsbDevice& device) {
        return isBehind(device.port(), hub.port()) && isKeyboardIn(device);
    });
}

/// Whether the device would have stayed out without this service, too.
bool GatePolicy::isClosedByOthers(const UsbDevice& device) const {
    const std::uint32_t bus = busOf(device.port());
    return std::any_of(state_.hubs.begin(), state_.hubs.end(), [&](const WrittenHub& known) {
        return known.bus == bus && !letsIn(known.value.before, device);
    });
}

bool GatePolicy::isLetInByItsPort(const UsbDevice& device) const {
    const std::uint32_t bus = busOf(device.port());
    return device.authorized && device.hardWired &&
           std::any_of(state_.hubs.begin(), state_.hubs.end(), [&](const WrittenHub& known) {
               return known.bus == bus && known.value.written == kHardWiredOnly;
           });
}

GatePolicy::Entry GatePolicy::entryOf(const Attachment& attachment) {
    return std::find_if(state_.devices.begin(), state_.devices.end(),
                        [&](const KnownDevice& known) { return known.attachment == attachment; });
}

WrittenHub* GatePolicy::hubAt(std::uint64_t inode) {
    const auto found = std::find_if(state_.hubs.begin(), state_.hubs.end(),
                                    [&](const WrittenHub& known) { return known.inode == inode; });
    return found == state_.hubs.end() ? nullptr : &*found;
}

} // namespace keystrand::usb
