#include "keystrand-linux/GatePolicy.h"

#include "base/Concat.h"

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

const RootHub* rootHubOf(const BusView& view, const UsbDevice& device) {
    const std::uint32_t bus = busOf(device.port());
    const auto found = std::find_if(view.rootHubs.begin(), view.rootHubs.end(),
                                    [&](const RootHub& hub) { return hub.bus == bus; });
    return found == view.rootHubs.end() ? nullptr : &*found;
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

bool WrittenDefault::isDue(BootTime now) const {
    return !failedAt || now - GatePolicy::kRetryTime >= *failedAt;
}

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
    if (state_.phase == Phase::opening) {
        takeInWhatCameLast(view, now);
    }
    // What was put back while the gate was opening has to be written once more, and so has what
    // somebody else has opened.
    for (const RootHub& hub : view.rootHubs) {
        WrittenHub* const known = hubAt(hub.inode);
        if (known == nullptr) {
            // One that is closed already was closed by somebody else, unless it came meanwhile.
            state_.hubs.push_back(
                closedHub(hub, valueWithoutTheParameter(hub).value_or(hub.authorizedDefault)));
        } else if (known->value.putBack || known->value.written != hub.authorizedDefault) {
            *known = closedHub(hub, hub.authorizedDefault);
        }
    }
    if (state_.parameter &&
        (state_.parameter->putBack || state_.parameter->written != view.parameter)) {
        state_.parameter.reset();
    }
    state_.phase = Phase::closed;
    tryAgain();
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
        putBackAt_.reset();
        tryAgain();
    }
}

void GatePolicy::takeOver(const BusView& view, BootTime now) {
    state_ = {.phase = Phase::closed};
    if (isClosed(view.parameter)) {
        state_.parameter = WrittenDefault{
            .before = kAsTheControllerHasIt, .written = view.parameter, .confirmed = true};
    }
    for (const RootHub& hub : view.rootHubs) {
        if (isClosed(hub.authorizedDefault)) {
            state_.hubs.push_back({.bus = hub.bus,
                                   .inode = hub.inode,
                                   .value = {.before = kEverybody,
                                             .written = hub.authorizedDefault,
                                             .confirmed = true}});
        }
    }
    for (const UsbDevice& device : view.devices) {
        state_.devices.push_back(
            {.attachment = device.attachment,
             .standing = device.authorized ? Standing::attached : Standing::refused,
             .since = now});
    }
}

/// What failed the other way may work this way.
void GatePolicy::tryAgain() {
    if (state_.parameter) {
        state_.parameter->failedAt.reset();
    }
    for (WrittenHub& hub : state_.hubs) {
        hub.value.failedAt.reset();
    }
    for (KnownDevice& device : state_.devices) {
        device.givenUp = false;
    }
}

void GatePolicy::keepOnly(IsKnown isKnown, const BusView& view, BootTime now) {
    isKnown_ = std::move(isKnown);
    returnsUntil_ = now + kReturnTime;
    for (const UsbDevice& device : view.devices) {
        const auto entry = entryOf(device.attachment);
        if (entry == state_.devices.end() || entry->standing != Standing::attached ||
            device.hardWired || isKnown_(device) ||
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

std::vector<GateAction> GatePolicy::decideDefaults(const BusView& glance, BootTime now) {
    return closed() && glance.hasUsb ? closeDefaults(glance, now) : Actions();
}

std::vector<GateAction> GatePolicy::decide(const BusView& view, BootTime now) {
    forgetWhatWent(view);
    if (!view.hasUsb) {
        // When it comes, it is as the kernel makes it.
        state_.parameter.reset();
        if (!closed()) {
            state_ = {};
        }
        return {};
    }
    switch (state_.phase) {
    case Phase::open:
        return {};
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
    Actions actions = closeDefaults(view, now);
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

GatePolicy::Actions GatePolicy::closeDefaults(const BusView& view, BootTime now) {
    Actions actions;
    if (!state_.parameter) {
        state_.parameter = WrittenDefault{.before = view.parameter, .written = closing_};
        if (isAsStrict(view.parameter, closing_)) {
            state_.parameter = WrittenDefault{
                .before = view.parameter, .written = view.parameter, .confirmed = true};
        }
    }
    if (!state_.parameter->confirmed && state_.parameter->isDue(now)) {
        actions.push_back(forParameter(state_.parameter->written));
    }
    for (const RootHub& hub : view.rootHubs) {
        if (hubAt(hub.inode) == nullptr) {
            state_.hubs.push_back(
                closedHub(hub, valueWithoutTheParameter(hub).value_or(hub.authorizedDefault)));
        }
        const WrittenHub* const known = hubAt(hub.inode);
        if (!known->value.confirmed && known->value.isDue(now)) {
            actions.push_back(forHub(hub, known->value.written));
        }
    }
    return actions;
}

WrittenHub GatePolicy::closedHub(const RootHub& hub, AuthorizedDefault before) const {
    const bool isStrict = isAsStrict(hub.authorizedDefault, closing_);
    return {.bus = hub.bus,
            .inode = hub.inode,
            .value = {.before = before,
                      .written = isStrict ? hub.authorizedDefault : closing_,
                      .confirmed = isStrict}};
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
        } else if (!known.givenUp && returns(device, now)) {
            known = {.attachment = device.attachment,
                     .standing = Standing::returned,
                     .since = now,
                     .confirmed = false};
            return forDevice(Kind::accept, device, Standing::returned);
        } else if (!known.givenUp && mayBeTheKeyboard(device) && wantsKeyboard(view)) {
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
    if (returns(device, now)) {
        known.standing = Standing::returned;
        known.confirmed = false;
        return forDevice(Kind::accept, device, Standing::returned);
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
    if (!putBackAt_ || now < *putBackAt_ + kLateTime) {
        takeInWhatCameLast(view, now);
    }
    Actions actions = putDefaultsBack(view, now);
    if (!actions.empty() || !putBackAt_) {
        putBackAt_ = now;
    }
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
    // What could not be put back is tried again.
    if (actions.empty() && putDefaultsBack(view, BootTime::max()).empty()) {
        endLate(now);
    }
    return actions;
}

/// What the kernel has refused on this service's behalf since the last look.
void GatePolicy::takeInWhatCameLast(const BusView& view, BootTime now) {
    for (const UsbDevice& device : view.devices) {
        const RootHub* const root = rootHubOf(view, device);
        if (root == nullptr || find(device.attachment) != nullptr) {
            continue;
        }
        const Standing out = refusesForThis(*root) ? Standing::refused : Standing::refusedByOthers;
        state_.devices.push_back({.attachment = device.attachment,
                                  .standing = device.authorized ? Standing::attached : out,
                                  .since = now});
    }
}

/// Whether it has refused devices on this service's behalf until now, or until it was put back,
/// which a service that was killed may have done without having it noted.
bool GatePolicy::refusesForThis(const RootHub& hub) const {
    for (const WrittenHub& known : state_.hubs) {
        if (known.inode == hub.inode) {
            const WrittenDefault& value = known.value;
            return value.isStillThere(hub.authorizedDefault) ||
                   (value.before != value.written && hub.authorizedDefault == value.before);
        }
    }
    return valueWithoutTheParameter(hub).has_value();
}

GatePolicy::Actions GatePolicy::putDefaultsBack(const BusView& view, BootTime now) {
    Actions actions;
    const auto& parameter = state_.parameter;
    if (parameter && !parameter->putBack && parameter->isStillThere(view.parameter) &&
        parameter->isDue(now)) {
        actions.push_back(forParameter(state_.parameter->before));
    }
    for (const RootHub& hub : view.rootHubs) {
        const auto before = valueBefore(hub);
        const auto known =
            std::find_if(state_.hubs.begin(), state_.hubs.end(),
                         [&](const WrittenHub& each) { return each.inode == hub.inode; });
        if (!before || (known != state_.hubs.end() && !known->value.isDue(now))) {
            continue;
        }
        actions.push_back(forHub(hub, *before));
        if (known == state_.hubs.end()) {
            // It came closed, because of the parameter.
            state_.hubs.push_back({.bus = hub.bus,
                                   .inode = hub.inode,
                                   .value = {.before = *before,
                                             .written = hub.authorizedDefault,
                                             .confirmed = true}});
        }
    }
    return actions;
}

/// What the root hub is to be again; none for one that reads something that this service did not
/// write: that is somebody else's by now.
std::optional<AuthorizedDefault> GatePolicy::valueBefore(const RootHub& hub) const {
    for (const WrittenHub& known : state_.hubs) {
        if (known.inode == hub.inode) {
            return !known.value.putBack && known.value.isStillThere(hub.authorizedDefault)
                       ? std::optional(known.value.before)
                       : std::nullopt;
        }
    }
    return valueWithoutTheParameter(hub);
}

/// For a root hub that came closed because of the parameter: what it would have been otherwise.
std::optional<AuthorizedDefault> GatePolicy::valueWithoutTheParameter(const RootHub& hub) const {
    const auto& parameter = state_.parameter;
    if (!parameter || !parameter->isStillThere(hub.authorizedDefault)) {
        return std::nullopt;
    }
    return parameter->before == kAsTheControllerHasIt ? kEverybody : parameter->before;
}

GatePolicy::Actions GatePolicy::letIn(const BusView& view, bool hubs) {
    Actions actions;
    for (const UsbDevice& device : view.devices) {
        const auto entry = entryOf(device.attachment);
        const RootHub* const root = rootHubOf(view, device);
        const bool isOurs =
            entry != state_.devices.end() && !entry->givenUp &&
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
            parameterPutBack(action, outcome, now);
        } else if (state_.parameter) {
            defaultWritten(*state_.parameter, outcome, now);
        }
        return;
    case Kind::setRootHub:
        if (state_.phase == Phase::opening) {
            hubPutBack(action, outcome, now);
        } else if (WrittenHub* const known = hubAt(action.hub.inode)) {
            defaultWritten(known->value, outcome, now);
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

void GatePolicy::defaultWritten(WrittenDefault& value, const GateOutcome& outcome, BootTime now) {
    value.failedAt.reset();
    value.confirmed =
        outcome.kind == GateOutcome::Kind::vanished || isAsStrict(outcome.readBack, value.written);
    if (value.confirmed) {
        return;
    }
    // A kernel that knows only two values reads back the other one, without an error.
    if (outcome.kind == GateOutcome::Kind::done && value.written == kHardWiredOnly) {
        closing_ = kNobody;
        value.written = kNobody;
        return;
    }
    value.failedAt = now;
}

/// It is remembered to the end: a root hub that came before this write is closed because of it.
void GatePolicy::parameterPutBack(const GateAction& action, const GateOutcome& outcome,
                                  BootTime now) {
    if (state_.parameter) {
        state_.parameter->putBack = outcome.readBack == action.value;
        state_.parameter->failedAt = state_.parameter->putBack ? std::nullopt : std::optional(now);
    }
}

/// It is remembered to the end, too: what it refused may come late.
void GatePolicy::hubPutBack(const GateAction& action, const GateOutcome& outcome, BootTime now) {
    if (WrittenHub* const known = hubAt(action.hub.inode)) {
        const bool isDone =
            outcome.kind == GateOutcome::Kind::vanished || outcome.readBack == action.value;
        known->value.putBack = isDone;
        known->value.failedAt = isDone ? std::nullopt : std::optional(now);
    }
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
        entry->standing = Standing::refused;
        entry->givenUp = true;
        break;
    }
    entry->confirmed = true;
    entry->since = now;
}

std::optional<BootTime> GatePolicy::nextLook() const {
    std::optional<BootTime> next;
    const auto lookAt = [&next](BootTime at) {
        next = std::min(next.value_or(at), at);
    };
    if (state_.parameter && state_.parameter->failedAt) {
        lookAt(*state_.parameter->failedAt + kRetryTime);
    }
    for (const WrittenHub& hub : state_.hubs) {
        if (hub.value.failedAt) {
            lookAt(*hub.value.failedAt + kRetryTime);
        }
    }
    if (putBackAt_ && isPutBack()) {
        lookAt(*putBackAt_ + kLateTime);
    }
    for (const KnownDevice& known : state_.devices) {
        if (closed() && !known.confirmed) {
            lookAt(known.since + kRetryTime);
        } else if (closed() && known.standing == Standing::probe) {
            lookAt(known.since + kProbeTime);
        }
    }
    return next;
}

bool GatePolicy::isPutBack() const {
    return state_.phase == Phase::open ||
           (state_.phase == Phase::opening && putBackAt_ && gaps().empty());
}

void GatePolicy::endLate(BootTime now) {
    if (state_.phase == Phase::opening && isPutBack() && now >= *putBackAt_ + kLateTime) {
        state_ = {};
        putBackAt_.reset();
    }
}

std::vector<std::string> GatePolicy::gaps() const {
    std::vector<std::string> gaps;
    if (state_.parameter && state_.parameter->failedAt) {
        gaps.emplace_back("the parameter authorized_default");
    }
    for (const WrittenHub& hub : state_.hubs) {
        if (hub.value.failedAt) {
            gaps.push_back(base::concat("root hub usb", std::to_string(hub.bus)));
        }
    }
    for (const KnownDevice& known : state_.devices) {
        if (closed() && known.standing == Standing::refused && !known.confirmed) {
            gaps.push_back(base::concat("device ", known.attachment.port));
        }
    }
    return gaps;
}

const KnownDevice* GatePolicy::find(const Attachment& attachment) const {
    const auto found =
        std::find_if(state_.devices.begin(), state_.devices.end(),
                     [&](const KnownDevice& known) { return known.attachment == attachment; });
    return found == state_.devices.end() ? nullptr : &*found;
}

/// Whether the machine had it when it went off, and it only takes its time now.
bool GatePolicy::returns(const UsbDevice& device, BootTime now) const {
    return isKnown_ && now < returnsUntil_ && isKnown_(device) && !isClosedByOthers(device);
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
