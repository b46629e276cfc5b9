#include "tests/keystrand-sessions/BusMachine.h"

#include "base/Concat.h"
#include "tests/keystrand/LoopTurns.h"

#include <systemd/sd-event.h>

#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <poll.h>
#include <stdexcept>
#include <string_view>
#include <unistd.h>
#include <utility>

namespace keystrand::sessions {

namespace {

constexpr char kManagerPath[] = "/org/freedesktop/login1";
constexpr char kManager[] = "org.freedesktop.login1.Manager";
constexpr char kSessions[] = "/org/freedesktop/login1/session";
constexpr char kSession[] = "org.freedesktop.login1.Session";
constexpr char kUnit[] = "/org/freedesktop/systemd1/unit/systemd_2dlogind_2eservice";
constexpr char kService[] = "org.freedesktop.systemd1.Service";

std::string pathOf(const std::string& id) {
    return base::concat(kSessions, "/_3", id);
}

void check(int result) {
    if (result < 0) {
        throw std::runtime_error(base::concat("the bus fails: ", -result));
    }
}

constexpr char kConfiguration[] =
    R"(<!DOCTYPE busconfig PUBLIC "-//freedesktop//DTD D-Bus Bus Configuration 1.0//EN"
 "http://www.freedesktop.org/standards/dbus/1.0/busconfig.dtd">
<busconfig><listen>unix:path=)";
constexpr char kRestOfConfiguration[] = R"(</listen><auth>EXTERNAL</auth>
<policy context="default"><allow send_destination="*"/><allow own="*"/><allow user="*"/>
<allow receive_type="method_call"/><allow receive_type="method_return"/><allow receive_type="error"/>
<allow receive_type="signal"/></policy>
</busconfig>)";

} // namespace

/// What is called on the bus.
struct BusMachine::Calls {
    static BusMachine& machine(void* data) { return *static_cast<BusMachine*>(data); }

    static int list(sd_bus_message* call, void* data, sd_bus_error* error) {
        if (machine(data).isFailing_) {
            return sd_bus_error_set(error, "org.freedesktop.DBus.Error.Failed", "Not now.");
        }
        sd_bus_message* reply = nullptr;
        check(sd_bus_message_new_method_return(call, &reply));
        check(sd_bus_message_open_container(reply, 'a', "(susso)"));
        for (const auto& [id, session] : machine(data).sessions_) {
            check(sd_bus_message_append(reply, "(susso)", id.c_str(), 1000, "somebody",
                                        session.seat.c_str(), pathOf(id).c_str()));
        }
        check(sd_bus_message_close_container(reply));
        check(sd_bus_send(nullptr, reply, nullptr));
        sd_bus_message_unref(reply);
        return 1;
    }

    static int inhibit(sd_bus_message* call, void* data, sd_bus_error* error) {
        BusMachine& self = machine(data);
        ++self.delaysAsked_;
        const char* what = nullptr;
        const char* who = nullptr;
        const char* why = nullptr;
        const char* mode = nullptr;
        check(sd_bus_message_read(call, "ssss", &what, &who, &why, &mode));
        if (self.isRefused_ || std::string_view(what) != "sleep" ||
            std::string_view(mode) != "delay" || std::string_view(who) != "keystrand-sessions") {
            return sd_bus_error_set(error, "org.freedesktop.DBus.Error.AccessDenied",
                                    "Permission denied");
        }
        int ends[2] = {};
        check(::pipe2(ends, O_CLOEXEC));
        self.delay_ = base::FileDescriptor(ends[0]);
        const base::FileDescriptor given(ends[1]);
        return sd_bus_reply_method_return(call, "h", given.get());
    }

    static int preparing(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply,
                         void* data, sd_bus_error*) {
        return sd_bus_message_append(reply, "b", machine(data).isPreparing_ ? 1 : 0);
    }

    static int started(sd_bus*, const char*, const char*, const char*, sd_bus_message* reply,
                       void* data, sd_bus_error*) {
        return sd_bus_message_append(reply, "t", machine(data).started_.value_or(0));
    }

    static int find(sd_bus*, const char* path, const char*, void* data, void** found,
                    sd_bus_error*) {
        for (auto& [id, session] : machine(data).sessions_) {
            if (pathOf(id) == path) {
                *found = &session;
                return 1;
            }
        }
        return 0;
    }

    static int property(sd_bus*, const char*, const char*, const char* property,
                        sd_bus_message* reply, void* data, sd_bus_error*) {
        const Session& session = *static_cast<Session*>(data);
        const std::string_view name = property;
        if (name == "Seat") {
            const std::string seat = base::concat("/org/freedesktop/login1/seat/", session.seat);
            return sd_bus_message_append(reply, "(so)", session.seat.c_str(),
                                         session.seat.empty() ? "/" : seat.c_str());
        }
        if (name == "TimestampMonotonic") {
            return sd_bus_message_append(reply, "t", session.created);
        }
        if (name == "Active" || name == "Remote" || name == "LockedHint") {
            const bool value = name == "Active"   ? session.isActive
                               : name == "Remote" ? session.isRemote
                                                  : session.isHintSet;
            return sd_bus_message_append(reply, "b", value ? 1 : 0);
        }
        const std::string& text = name == "Id"      ? session.id
                                  : name == "Class" ? session.sessionClass
                                                    : session.state;
        return sd_bus_message_append(reply, "s", text.c_str());
    }

    static int count(sd_bus_message* message, void* data, sd_bus_error*) {
        const bool isQuestion =
            sd_bus_message_is_method_call(message, "org.freedesktop.DBus.Properties", "GetAll") > 0;
        machine(data).questions_ += isQuestion ? 1 : 0;
        return 0;
    }
};

BusMachine::BusMachine(At bus) {
    std::filesystem::create_directory(directory_.file("sessions"));
    std::ofstream(directory_.file("configuration"))
        << kConfiguration << directory_.file("bus") << kRestOfConfiguration;
    if (bus == At::once) {
        startBus();
    }
    logind_ = std::make_unique<BusLogind>(
        *loop_, timers, BusLogind::Places{directory_.file("bus"), directory_.file("sessions")},
        [this](SessionsLine, const std::string& line) { lines_.push_back(line); });
}

BusMachine::~BusMachine() {
    stopLogind();
}

void BusMachine::startBus() {
    daemon_ = std::make_unique<support::Program>(std::vector<std::string>{
        "/usr/bin/dbus-daemon", "--nofork", "--nopidfile", "--print-address=1",
        base::concat("--config-file=", directory_.file("configuration"))});
    if (!daemon_->awaitLine("unix:path=")) {
        throw std::runtime_error("there is no message bus");
    }
}

void BusMachine::stopBus() {
    stopLogind();
    daemon_->signal(SIGKILL);
    static_cast<void>(daemon_->awaitEnd());
}

sd_bus* BusMachine::connect() {
    sd_bus* bus = nullptr;
    check(sd_bus_new(&bus));
    check(sd_bus_set_address(bus, base::concat("unix:path=", directory_.file("bus")).c_str()));
    check(sd_bus_set_bus_client(bus, 1));
    check(sd_bus_start(bus));
    return bus;
}

void BusMachine::startLogind(std::optional<MonotonicTime> started) {
    static const sd_bus_vtable kManagerTable[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_METHOD("ListSessions", "", "a(susso)", Calls::list, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_METHOD("Inhibit", "ssss", "h", Calls::inhibit, SD_BUS_VTABLE_UNPRIVILEGED),
        SD_BUS_PROPERTY("PreparingForSleep", "b", Calls::preparing, 0, 0), SD_BUS_VTABLE_END};
    static const sd_bus_vtable kServiceTable[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_PROPERTY("ExecMainStartTimestampMonotonic", "t", Calls::started, 0, 0),
        SD_BUS_VTABLE_END};
    constexpr std::uint64_t kTold = SD_BUS_VTABLE_PROPERTY_EMITS_CHANGE;
    static const sd_bus_vtable kSessionTable[] = {
        SD_BUS_VTABLE_START(0),
        SD_BUS_PROPERTY("Id", "s", Calls::property, 0, 0),
        SD_BUS_PROPERTY("Seat", "(so)", Calls::property, 0, 0),
        SD_BUS_PROPERTY("Class", "s", Calls::property, 0, 0),
        SD_BUS_PROPERTY("State", "s", Calls::property, 0, 0),
        SD_BUS_PROPERTY("Active", "b", Calls::property, 0, kTold),
        SD_BUS_PROPERTY("Remote", "b", Calls::property, 0, 0),
        SD_BUS_PROPERTY("LockedHint", "b", Calls::property, 0, kTold),
        SD_BUS_PROPERTY("TimestampMonotonic", "t", Calls::property, 0, 0),
        SD_BUS_VTABLE_END};
    stopLogind();
    started_ = started;
    isPreparing_ = false;
    for (auto& [id, session] : sessions_) {
        session.isHintSet = false;
    }
    bus_ = connect();
    check(sd_bus_add_filter(bus_, nullptr, Calls::count, this));
    check(sd_bus_add_object_vtable(bus_, nullptr, kManagerPath, kManager, kManagerTable, this));
    check(sd_bus_add_object_vtable(bus_, nullptr, kUnit, kService, kServiceTable, this));
    check(sd_bus_add_fallback_vtable(bus_, nullptr, kSessions, kSession, kSessionTable, Calls::find,
                                     this));
    if (started) {
        check(sd_bus_request_name(bus_, "org.freedesktop.systemd1", 0));
    }
    check(sd_bus_request_name(bus_, "org.freedesktop.login1", 0));
    check(sd_bus_attach_event(bus_, loop_->handle(), SD_EVENT_PRIORITY_NORMAL));
}

void BusMachine::stopLogind() {
    delay_.reset();
    if (bus_ != nullptr) {
        sd_bus_detach_event(bus_);
        bus_ = sd_bus_flush_close_unref(bus_);
    }
}

void BusMachine::put(const Session& session) {
    const auto found = sessions_.find(session.id);
    const std::optional<Session> before =
        found == sessions_.end() ? std::nullopt : std::optional(found->second);
    sessions_[session.id] = session;
    if (bus_ == nullptr) {
        return;
    }
    if (before) {
        emitChanges(*before, session);
        return;
    }
    check(sd_bus_emit_signal(bus_, kManagerPath, kManager, "SessionNew", "so", session.id.c_str(),
                             pathOf(session.id).c_str()));
}

void BusMachine::emitChanges(const Session& before, const Session& after) {
    const std::string path = pathOf(after.id);
    if (before.isHintSet != after.isHintSet) {
        check(sd_bus_emit_properties_changed(bus_, path.c_str(), kSession, "LockedHint", nullptr));
    }
    if (before.isActive != after.isActive) {
        check(sd_bus_emit_properties_changed(bus_, path.c_str(), kSession, "Active", nullptr));
    }
    if (before.state != after.state) {
        touchFile();
    }
}

void BusMachine::putIntoFile(const Session& session) {
    sessions_[session.id] = session;
    touchFile();
}

void BusMachine::touchFile() {
    const std::string file = directory_.file("file");
    std::ofstream stream(file);
    stream << "STATE=\n";
    stream.close();
    std::filesystem::rename(file, directory_.file("sessions/1"));
}

void BusMachine::remove(const std::string& id) {
    sessions_.erase(id);
    check(sd_bus_emit_signal(bus_, kManagerPath, kManager, "SessionRemoved", "so", id.c_str(),
                             pathOf(id).c_str()));
}

void BusMachine::prepareForSleep(bool isAboutTo) {
    isPreparing_ = isAboutTo;
    check(sd_bus_emit_signal(bus_, kManagerPath, kManager, "PrepareForSleep", "b",
                             isAboutTo ? 1 : 0));
}

void BusMachine::pretend(const Session& session) {
    sd_bus* const other = connect();
    const std::string path = pathOf(session.id);
    check(sd_bus_emit_signal(other, path.c_str(), "org.freedesktop.DBus.Properties",
                             "PropertiesChanged", "sa{sv}as", kSession, 1, "LockedHint", "b",
                             session.isHintSet ? 1 : 0, 0));
    sd_bus_flush_close_unref(other);
}

bool BusMachine::isSleepDelayed() {
    pollfd end{delay_.get(), 0, 0};
    return delay_.isOpen() && ::poll(&end, 1, 0) == 0;
}

bool BusMachine::happenUntil(const std::function<bool()>& isSo) {
    using Clock = std::chrono::steady_clock;
    constexpr std::uint64_t kTurn = 20'000;
    const auto end = Clock::now() + support::kPatience;
    timers.pass(std::chrono::milliseconds(0));
    while (!isSo()) {
        if (Clock::now() > end) {
            return false;
        }
        // Nothing more comes by itself: then it is the time that passes.
        if (sd_event_run(loop_->handle(), kTurn) == 0) {
            timers.pass(std::chrono::seconds(1));
        }
    }
    return true;
}

} // namespace keystrand::sessions
