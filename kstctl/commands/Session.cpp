#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "kstctl/CommandLine.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"

#include <systemd/sd-bus.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <iterator>
#include <optional>
#include <string>
#include <sys/socket.h>
#include <system_error>
#include <unistd.h>

namespace kstctl {

namespace {

constexpr char kLogind[] = "org.freedesktop.login1";
constexpr char kManagerPath[] = "/org/freedesktop/login1";
constexpr char kManager[] = "org.freedesktop.login1.Manager";
constexpr char kUser[] = "org.freedesktop.login1.User";
constexpr char kSession[] = "org.freedesktop.login1.Session";
constexpr std::uint64_t kPatienceMicroseconds = 30'000'000;

constexpr const char* kNobodyThere[] = {
    "org.freedesktop.DBus.Error.ServiceUnknown", "org.freedesktop.DBus.Error.NameHasNoOwner",
    "org.freedesktop.login1.NoSuchSession", "org.freedesktop.login1.NoSuchUser"};
constexpr const char* kRefused[] = {"org.freedesktop.DBus.Error.AccessDenied",
                                    "org.freedesktop.DBus.Error.InteractiveAuthorizationRequired"};

/// What a call on the bus has to say when it fails.
class CallError {
  public:
    CallError() = default;
    CallError(const CallError&) = delete;
    CallError& operator=(const CallError&) = delete;
    ~CallError() { sd_bus_error_free(&error_); }

    [[nodiscard]] sd_bus_error* get() { return &error_; }
    [[nodiscard]] bool has(const char* name) const {
        return sd_bus_error_has_name(&error_, name) > 0;
    }
    [[nodiscard]] platform::Error failureOf(int result) const {
        if (result >= 0) {
            return failure(ExitStatus::malformed, "logind's answer cannot be understood");
        }
        const auto isOneOf = [this](const auto& names) {
            return std::any_of(std::begin(names), std::end(names),
                               [this](const char* name) { return has(name); });
        };
        const ExitStatus status = isOneOf(kNobodyThere) ? ExitStatus::missing
                                  : isOneOf(kRefused)   ? ExitStatus::unreadable
                                                        : ExitStatus::failed;
        return failure(status,
                       base::concat("logind: ", error_.message != nullptr
                                                    ? std::string(error_.message)
                                                    : std::generic_category().message(-result)));
    }

  private:
    sd_bus_error error_{};
};

class Message {
  public:
    Message() = default;
    Message(const Message&) = delete;
    Message& operator=(const Message&) = delete;
    ~Message() { sd_bus_message_unref(message_); }

    [[nodiscard]] sd_bus_message** out() { return &message_; }
    [[nodiscard]] sd_bus_message* get() const { return message_; }

  private:
    sd_bus_message* message_ = nullptr;
};

/// logind, as the calling user sees it.
class UsersLogind {
  public:
    UsersLogind() = default;
    UsersLogind(const UsersLogind&) = delete;
    UsersLogind& operator=(const UsersLogind&) = delete;
    ~UsersLogind() { sd_bus_flush_close_unref(bus_); }

    [[nodiscard]] std::optional<platform::Error> connect(const std::string& path);

    struct Session {
        std::string id;
        /// Of its object.
        std::string path;
    };
    /// The session that the caller runs in. Services of a user run in none; theirs is the one that
    /// the user sits at.
    [[nodiscard]] platform::Result<Session> sessionOfCaller();
    [[nodiscard]] std::optional<platform::Error> setLockedHint(const Session& session,
                                                               bool isLocked);

  private:
    [[nodiscard]] platform::Result<Session> displaySession();
    [[nodiscard]] std::optional<platform::Error> start(base::FileDescriptor connection);

    sd_bus* bus_ = nullptr;
};

std::optional<platform::Error> UsersLogind::connect(const std::string& path) {
    const auto address = base::UnixAddress::of(path);
    if (!address) {
        return failure(ExitStatus::failed, base::concat(path, ": too long for a socket"));
    }
    base::FileDescriptor connection(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!connection.isOpen() || ::connect(connection.get(), address->get(), address->size()) != 0) {
        return errno == ENOENT || errno == ENOTDIR || errno == ECONNREFUSED
                   ? failure(ExitStatus::missing, base::concat("there is no message bus at ", path))
                   : fileError(path, errno);
    }
    return start(std::move(connection));
}

std::optional<platform::Error> UsersLogind::start(base::FileDescriptor connection) {
    int result = sd_bus_new(&bus_);
    if (result >= 0) {
        result = sd_bus_set_fd(bus_, connection.get(), connection.get());
    }
    if (result >= 0) {
        // It is the bus's from here on.
        static_cast<void>(connection.release());
        result = sd_bus_set_bus_client(bus_, 1);
    }
    if (result >= 0) {
        result = sd_bus_set_method_call_timeout(bus_, kPatienceMicroseconds);
    }
    if (result >= 0) {
        result = sd_bus_start(bus_);
    }
    return result < 0
               ? std::optional(failure(ExitStatus::failed,
                                       base::concat("the message bus cannot be used: ",
                                                    std::generic_category().message(-result))))
               : std::nullopt;
}

platform::Result<UsersLogind::Session> UsersLogind::sessionOfCaller() {
    const char* const id = std::getenv("XDG_SESSION_ID");
    if (id == nullptr || *id == '\0') {
        return displaySession();
    }
    CallError error;
    Message reply;
    const int result = sd_bus_call_method(bus_, kLogind, kManagerPath, kManager, "GetSession",
                                          error.get(), reply.out(), "s", id);
    // A service may have the variable of a session that is gone.
    if (result < 0 && error.has("org.freedesktop.login1.NoSuchSession")) {
        return displaySession();
    }
    const char* path = nullptr;
    if (result < 0 || sd_bus_message_read(reply.get(), "o", &path) <= 0) {
        return error.failureOf(result);
    }
    return Session{id, path};
}

platform::Result<UsersLogind::Session> UsersLogind::displaySession() {
    const uid_t user = ::getuid();
    const auto none = [user] {
        return failure(ExitStatus::missing, base::concat("user ", user, " has no session"));
    };
    CallError error;
    Message found;
    int result = sd_bus_call_method(bus_, kLogind, kManagerPath, kManager, "GetUser", error.get(),
                                    found.out(), "u", static_cast<std::uint32_t>(user));
    if (error.has("org.freedesktop.login1.NoSuchUser")) {
        return none();
    }
    const char* userPath = nullptr;
    if (result < 0 || sd_bus_message_read(found.get(), "o", &userPath) <= 0) {
        return error.failureOf(result);
    }
    Message display;
    result = sd_bus_get_property(bus_, kLogind, userPath, kUser, "Display", error.get(),
                                 display.out(), "(so)");
    const char* id = nullptr;
    const char* path = nullptr;
    if (result < 0 || sd_bus_message_read(display.get(), "(so)", &id, &path) <= 0) {
        return error.failureOf(result);
    }
    return *id != '\0' ? platform::Result<Session>(Session{id, path}) : none();
}

std::optional<platform::Error> UsersLogind::setLockedHint(const Session& session, bool isLocked) {
    CallError error;
    const int result =
        sd_bus_call_method(bus_, kLogind, session.path.c_str(), kSession, "SetLockedHint",
                           error.get(), nullptr, "b", isLocked ? 1 : 0);
    return result < 0 ? std::optional(error.failureOf(result)) : std::nullopt;
}

} // namespace

ExitStatus run(const LockCommand& command, const Environment& environment) {
    UsersLogind logind;
    if (const auto error = logind.connect(environment.paths.systemBus())) {
        return environment.output.finish(*error);
    }
    const auto session = logind.sessionOfCaller();
    if (!session) {
        return environment.output.finish(session.error());
    }
    if (const auto error = logind.setLockedHint(session.value(), command.isLocked)) {
        return environment.output.finish(*error);
    }
    if (environment.output.isJSON()) {
        environment.output.show(
            Report().add("session", session.value().id).add("isLocked", command.isLocked));
    }
    return environment.output.finish(ExitStatus::success);
}

} // namespace kstctl
