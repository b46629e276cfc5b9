#include "keystrand-sessions/BusLogind.h"

#include "base/Concat.h"

#include <systemd/sd-bus.h>

#include <array>
#include <fcntl.h>
#include <string_view>
#include <sys/epoll.h>
#include <sys/inotify.h>
#include <system_error>
#include <utility>
#include <vector>

namespace keystrand::sessions {

namespace {

constexpr char kBus[] = "org.freedesktop.DBus";
constexpr char kBusPath[] = "/org/freedesktop/DBus";
constexpr char kProperties[] = "org.freedesktop.DBus.Properties";
constexpr char kLogind[] = "org.freedesktop.login1";
constexpr char kManagerPath[] = "/org/freedesktop/login1";
constexpr char kManager[] = "org.freedesktop.login1.Manager";
constexpr char kSession[] = "org.freedesktop.login1.Session";
constexpr char kSystemd[] = "org.freedesktop.systemd1";
constexpr char kService[] = "org.freedesktop.systemd1.Service";
constexpr char kLogindUnit[] = "/org/freedesktop/systemd1/unit/systemd_2dlogind_2eservice";

constexpr char kOwnerChanges[] =
    "type='signal',sender='org.freedesktop.DBus',path='/org/freedesktop/DBus',"
    "interface='org.freedesktop.DBus',member='NameOwnerChanged',arg0='org.freedesktop.login1'";
constexpr char kManagerSignals[] =
    "type='signal',sender='org.freedesktop.login1',path='/org/freedesktop/login1',"
    "interface='org.freedesktop.login1.Manager'";
constexpr char kSessionChanges[] =
    "type='signal',sender='org.freedesktop.login1',path_namespace='/org/freedesktop/login1/"
    "session',"
    "interface='org.freedesktop.DBus.Properties',member='PropertiesChanged',"
    "arg0='org.freedesktop.login1.Session'";

std::string textOf(int error) {
    return std::generic_category().message(-error);
}

bool isError(sd_bus_message* reply) {
    return sd_bus_message_is_method_error(reply, nullptr) > 0;
}

std::string errorText(sd_bus_message* reply) {
    const sd_bus_error* const error = sd_bus_message_get_error(reply);
    return error->message != nullptr ? error->message : error->name;
}

int readBool(sd_bus_message* message, bool& value) {
    int read = 0;
    const int result = sd_bus_message_read(message, "b", &read);
    value = result > 0 ? read != 0 : value;
    return result;
}

int readText(sd_bus_message* message, std::string& value) {
    const char* read = nullptr;
    const int result = sd_bus_message_read(message, "s", &read);
    value = result > 0 ? read : value;
    return result;
}

/// A value that stands in a variant of that type. Any other type leaves what is there.
int inVariant(sd_bus_message* message, const char* type,
              const std::function<int(sd_bus_message*)>& read) {
    const char* contents = nullptr;
    int result = sd_bus_message_peek_type(message, nullptr, &contents);
    if (result < 0 || contents == nullptr || std::string_view(contents) != type) {
        return sd_bus_message_skip(message, "v");
    }
    result = sd_bus_message_enter_container(message, 'v', type);
    if (result >= 0) {
        result = read(message);
    }
    return result < 0 ? result : sd_bus_message_exit_container(message);
}

int readSeat(sd_bus_message* message, std::string& seat) {
    const char* name = nullptr;
    const char* path = nullptr;
    const int result = sd_bus_message_read(message, "(so)", &name, &path);
    seat = result > 0 ? name : seat;
    return result;
}

int readProperty(sd_bus_message* message, std::string_view name, Session& session) {
    const auto text = [&](std::string& value) {
        return inVariant(message, "s", [&](sd_bus_message* in) { return readText(in, value); });
    };
    const auto truth = [&](bool& value) {
        return inVariant(message, "b", [&](sd_bus_message* in) { return readBool(in, value); });
    };
    if (name == "Id") {
        return text(session.id);
    }
    if (name == "Class") {
        return text(session.sessionClass);
    }
    if (name == "State") {
        return text(session.state);
    }
    if (name == "Active") {
        return truth(session.isActive);
    }
    if (name == "Remote") {
        return truth(session.isRemote);
    }
    if (name == "LockedHint") {
        return truth(session.isHintSet);
    }
    if (name == "Seat") {
        return inVariant(message, "(so)",
                         [&](sd_bus_message* in) { return readSeat(in, session.seat); });
    }
    if (name == "TimestampMonotonic") {
        return inVariant(message, "t", [&](sd_bus_message* in) {
            return sd_bus_message_read(in, "t", &session.created);
        });
    }
    return sd_bus_message_skip(message, "v");
}

/// Takes over what a map of properties says. False when it cannot be read.
bool readProperties(sd_bus_message* message, Session& session) {
    int result = sd_bus_message_enter_container(message, 'a', "{sv}");
    while (result >= 0 && (result = sd_bus_message_enter_container(message, 'e', "sv")) > 0) {
        const char* name = nullptr;
        result = sd_bus_message_read(message, "s", &name);
        if (result >= 0) {
            result = readProperty(message, name, session);
        }
        if (result >= 0) {
            result = sd_bus_message_exit_container(message);
        }
    }
    return result >= 0 && sd_bus_message_exit_container(message) >= 0;
}

} // namespace

BusLogind::BusLogind(EventLoop& loop, Timers& timers, Places places, SessionsLog log)
    : loop_(loop),
      places_(std::move(places)),
      log_(std::move(log)),
      backoff_(timers.timer([this] { tryAgain(); })) {}

BusLogind::~BusLogind() {
    disconnect();
}

void BusLogind::start(LogindListener& listener) {
    listener_ = &listener;
    watchFiles();
    backoff_->startFor(std::chrono::milliseconds(0));
}

// The bus.

void BusLogind::tryAgain() {
    if (bus_ != nullptr && sd_bus_is_open(bus_) > 0) {
        askForOwner();
        return;
    }
    disconnect();
    if (const int result = connect(); result < 0) {
        disconnect();
        if (const std::string trouble = textOf(result); trouble != busTrouble_) {
            busTrouble_ = trouble;
            log_(SessionsLine::noBus,
                 base::concat("the message bus cannot be reached, and is tried again and again: ",
                              trouble, "."));
        }
        backoff_->startFor(kBackoff);
    }
}

int BusLogind::connect() {
    int result = sd_bus_new(&bus_);
    const auto then = [&result](int next) {
        result = next;
        return result >= 0;
    };
    if (result >= 0 &&
        then(sd_bus_set_address(bus_, base::concat("unix:path=", places_.bus).c_str())) &&
        then(sd_bus_set_bus_client(bus_, 1)) &&
        then(sd_bus_set_method_call_timeout(bus_, std::chrono::microseconds(kPatience).count())) &&
        then(sd_bus_start(bus_)) &&
        then(sd_bus_attach_event(bus_, loop_.handle(), SD_EVENT_PRIORITY_NORMAL)) &&
        then(addMatches() ? 0 : -ENOMEM)) {
        askForOwner();
    }
    return result;
}

void BusLogind::disconnect() {
    ++turn_;
    if (bus_ != nullptr) {
        sd_bus_detach_event(bus_);
        bus_ = sd_bus_close_unref(bus_);
    }
}

template <BusLogind::Signal handler>
int BusLogind::handle(sd_bus_message* signal, void* self, sd_bus_error* /*error*/) {
    (static_cast<BusLogind*>(self)->*handler)(signal);
    return 0;
}

bool BusLogind::addMatches() {
    const auto add = [this](const char* match, sd_bus_message_handler_t handler) {
        return sd_bus_add_match_async(bus_, nullptr, match, handler, nullptr, this) >= 0;
    };
    return sd_bus_match_signal_async(bus_, nullptr, "org.freedesktop.DBus.Local",
                                     "/org/freedesktop/DBus/Local", "org.freedesktop.DBus.Local",
                                     "Disconnected", handle<&BusLogind::onDisconnected>, nullptr,
                                     this) >= 0 &&
           add(kOwnerChanges, handle<&BusLogind::onOwnerChanged>) &&
           add(kManagerSignals, handle<&BusLogind::onManagerSignal>) &&
           add(kSessionChanges, handle<&BusLogind::onPropertiesChanged>);
}

void BusLogind::onDisconnected(sd_bus_message* /*signal*/) {
    // The connection is still in use here, and goes when another is made.
    ownerIs({});
    backoff_->startFor(kBackoff);
}

/// What is kept until a call is answered.
struct BusLogind::Call {
    BusLogind* self;
    std::uint64_t turn;
    Reply reply;
};

void BusLogind::call(const char* destination, const char* path, const char* interface,
                     const char* method, const Arguments& arguments, Reply reply) {
    sd_bus_message* message = nullptr;
    sd_bus_slot* slot = nullptr;
    auto pending = std::make_unique<Call>(Call{this, turn_, std::move(reply)});
    const auto whenAnswered = [](sd_bus_message* answer, void* data, sd_bus_error*) {
        const Call& call = *static_cast<Call*>(data);
        if (call.turn == call.self->turn_) {
            call.reply(answer);
        }
        return 0;
    };
    // What cannot be asked, because there is no room or no connection, ends with the connection.
    if (sd_bus_message_new_method_call(bus_, &message, destination, path, interface, method) >= 0 &&
        sd_bus_message_set_auto_start(message, 0) >= 0 &&
        (arguments == nullptr || arguments(message) >= 0) &&
        sd_bus_call_async(bus_, &slot, message, whenAnswered, pending.get(), 0) >= 0) {
        sd_bus_slot_set_destroy_callback(slot, [](void* data) { delete static_cast<Call*>(data); });
        sd_bus_slot_set_floating(slot, 1);
        static_cast<void>(pending.release());
    }
    sd_bus_slot_unref(slot);
    sd_bus_message_unref(message);
}

void BusLogind::getProperty(const char* destination, const char* path, const char* interface,
                            const char* name, Reply reply) {
    call(
        destination, path, kProperties, "Get",
        [=](sd_bus_message* call) { return sd_bus_message_append(call, "ss", interface, name); },
        std::move(reply));
}

// Which logind there is.

void BusLogind::askForOwner() {
    call(
        kBus, kBusPath, kBus, "GetNameOwner",
        [](sd_bus_message* call) { return sd_bus_message_append(call, "s", kLogind); },
        [this](sd_bus_message* reply) {
            busTrouble_.clear();
            std::string name;
            if (!isError(reply)) {
                readText(reply, name);
            }
            ownerIs(name);
        });
}

void BusLogind::onOwnerChanged(sd_bus_message* signal) {
    const char* name = nullptr;
    const char* before = nullptr;
    const char* now = nullptr;
    if (sd_bus_message_read(signal, "sss", &name, &before, &now) > 0) {
        ownerIs(now);
    }
}

void BusLogind::ownerIs(const std::string& name) {
    ++turn_;
    const bool wasTold = std::exchange(isTold_, false);
    process_ = {name, std::nullopt};
    sessions_.clear();
    unanswered_ = 0;
    isAskedAgain_ = false;
    areSessionsListed_ = false;
    isPreparingForSleep_ = false;
    isDelayAsked_ = false;
    delay_.reset();
    if (!name.empty()) {
        takeDelay();
        askWhenItStarted();
    }
    if (wasTold) {
        listener_->isAway();
    }
}

void BusLogind::askWhenItStarted() {
    getProperty(kSystemd, kLogindUnit, kService, "ExecMainStartTimestampMonotonic",
                [this](sd_bus_message* reply) {
                    MonotonicTime started = 0;
                    if (!isError(reply) && sd_bus_message_read(reply, "v", "t", &started) > 0 &&
                        started != 0) {
                        process_.started = started;
                    }
                    askForSleep();
                });
}

void BusLogind::askForSleep() {
    getProperty(process_.uniqueName.c_str(), kManagerPath, kManager, "PreparingForSleep",
                [this](sd_bus_message* reply) {
                    int isPreparing = 0;
                    if (!isError(reply) && sd_bus_message_read(reply, "v", "b", &isPreparing) > 0) {
                        isPreparingForSleep_ = isPreparing != 0;
                    }
                    askForSessions();
                });
}

// Its sessions.

void BusLogind::askForSessions() {
    call(process_.uniqueName.c_str(), kManagerPath, kManager, "ListSessions", nullptr,
         [this](sd_bus_message* reply) { readSessions(reply); });
}

void BusLogind::readSessions(sd_bus_message* reply) {
    std::vector<std::string> paths;
    int result = isError(reply) ? -EIO : sd_bus_message_enter_container(reply, 'a', "(susso)");
    while (result >= 0) {
        const char* id = nullptr;
        std::uint32_t user = 0;
        const char* name = nullptr;
        const char* seat = nullptr;
        const char* path = nullptr;
        result = sd_bus_message_read(reply, "(susso)", &id, &user, &name, &seat, &path);
        if (result <= 0) {
            break;
        }
        paths.emplace_back(path);
    }
    if (result < 0) {
        // It is there and does not answer.
        backoff_->startFor(kBackoff);
        return;
    }
    // One of its own, so that it is told that it is there only when all have been asked for.
    ++unanswered_;
    for (const std::string& path : paths) {
        askFor(path);
    }
    areSessionsListed_ = true;
    answered();
}

void BusLogind::askFor(const std::string& path) {
    ++unanswered_;
    call(
        process_.uniqueName.c_str(), path.c_str(), kProperties, "GetAll",
        [](sd_bus_message* call) { return sd_bus_message_append(call, "s", kSession); },
        [this, path](sd_bus_message* reply) {
            Session session;
            // One that cannot be asked for has just gone.
            if (!isError(reply) && readProperties(reply, session)) {
                change(path, session);
            }
            answered();
        });
}

void BusLogind::answered() {
    --unanswered_;
    if (unanswered_ > 0) {
        return;
    }
    if (!isTold_ && areSessionsListed_) {
        isTold_ = true;
        std::vector<Session> sessions;
        for (const auto& [path, session] : sessions_) {
            sessions.push_back(session);
        }
        watchFiles();
        listener_->isThere(process_, sessions, isPreparingForSleep_);
    }
    if (std::exchange(isAskedAgain_, false)) {
        askForAll();
    }
}

void BusLogind::change(const std::string& path, const Session& session) {
    const auto [found, isNew] = sessions_.try_emplace(path);
    if (isNew || found->second != session) {
        found->second = session;
        if (isTold_) {
            listener_->sessionIs(session);
        }
    }
}

void BusLogind::onManagerSignal(sd_bus_message* signal) {
    if (process_.uniqueName != sd_bus_message_get_sender(signal)) {
        return;
    }
    const char* id = nullptr;
    const char* path = nullptr;
    if (sd_bus_message_is_signal(signal, kManager, "SessionNew") > 0) {
        if (sd_bus_message_read(signal, "so", &id, &path) > 0) {
            askFor(path);
        }
    } else if (sd_bus_message_is_signal(signal, kManager, "SessionRemoved") > 0) {
        if (sd_bus_message_read(signal, "so", &id, &path) > 0 && sessions_.erase(path) > 0 &&
            isTold_) {
            listener_->sessionIsGone(id);
        }
    } else if (sd_bus_message_is_signal(signal, kManager, "PrepareForSleep") > 0 &&
               readBool(signal, isPreparingForSleep_) > 0 && isTold_) {
        listener_->prepareForSleep(isPreparingForSleep_);
    }
}

void BusLogind::onPropertiesChanged(sd_bus_message* signal) {
    const std::string path = sd_bus_message_get_path(signal);
    const auto found = sessions_.find(path);
    const char* interface = nullptr;
    // Those of a session that was asked for and has not answered come with its answer.
    if (found == sessions_.end() || process_.uniqueName != sd_bus_message_get_sender(signal) ||
        sd_bus_message_read(signal, "s", &interface) <= 0) {
        return;
    }
    Session session = found->second;
    if (readProperties(signal, session)) {
        change(path, session);
    }
}

void BusLogind::askForAll() {
    if (unanswered_ > 0) {
        isAskedAgain_ = true;
        return;
    }
    for (const auto& [path, session] : sessions_) {
        askFor(path);
    }
}

void BusLogind::watchFiles() {
    if (filesSource_) {
        return;
    }
    files_ = base::FileDescriptor(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (::inotify_add_watch(files_.get(), places_.sessions.c_str(),
                            IN_MOVED_TO | IN_DELETE | IN_ONLYDIR) < 0) {
        return;
    }
    filesSource_ = loop_.watch(files_.get(), EPOLLIN, [this](std::uint32_t) {
        std::array<char, 4096> events{};
        while (::read(files_.get(), events.data(), events.size()) > 0) {
        }
        if (isTold_) {
            askForAll();
        }
    });
}

// Sleep.

void BusLogind::delaySleep() {
    wantsDelay_ = true;
    takeDelay();
}

void BusLogind::letSleep() {
    wantsDelay_ = false;
    delay_.reset();
}

void BusLogind::takeDelay() {
    if (!wantsDelay_ || isDelayAsked_ || delay_.isOpen() || process_.uniqueName.empty()) {
        return;
    }
    isDelayAsked_ = true;
    call(
        process_.uniqueName.c_str(), kManagerPath, kManager, "Inhibit",
        [](sd_bus_message* call) {
            return sd_bus_message_append(call, "ssss", "sleep", "keystrand-sessions",
                                         "USB is closed for new devices first", "delay");
        },
        [this](sd_bus_message* reply) { readDelay(reply); });
}

void BusLogind::readDelay(sd_bus_message* reply) {
    isDelayAsked_ = false;
    int fd = -1;
    if (isError(reply)) {
        if (const std::string trouble = errorText(reply); trouble != delayTrouble_) {
            delayTrouble_ = trouble;
            log_(SessionsLine::noDelay,
                 base::concat("sleep cannot be delayed until USB is closed: ", trouble));
        }
    } else if (wantsDelay_ && sd_bus_message_read(reply, "h", &fd) > 0) {
        delayTrouble_.clear();
        // The message keeps its own.
        delay_ = base::FileDescriptor(::fcntl(fd, F_DUPFD_CLOEXEC, 3));
    }
}

} // namespace keystrand::sessions
