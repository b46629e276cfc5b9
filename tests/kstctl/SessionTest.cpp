// `kstctl lock` and `unlock` on a message bus of the test's, with a logind that decides as the real
// one does.

#include "base/Concat.h"
#include "tests/kstctl/KstctlFixture.h"
#include "tests/kstctl/PacketServer.h"

#include <systemd/sd-bus.h>

#include <cstdint>
#include <fcntl.h>
#include <filesystem>
#include <map>
#include <string_view>

namespace kstctl {
namespace {

namespace fs = std::filesystem;

using base::concat;
using platform::Value;

constexpr char kSessions[] = "/org/freedesktop/login1/session/_3";
constexpr char kUsers[] = "/org/freedesktop/login1/user/_";

/// What a bus and the logind on it answer. Told before it serves, and asked afterwards.
class FakeLogind {
  public:
    /// The users of sessions.
    std::map<std::string, uid_t> sessions;
    /// The sessions that users sit at; empty for a user with none of these.
    std::map<uid_t, std::string> displays;
    /// Every call is answered with this error.
    std::string error;
    /// It ends the connection when that is called.
    std::string lastCall;
    /// Every call is answered with a number.
    bool isConfused = false;
    /// "2 locked" and "2 unlocked"
    std::vector<std::string> hints;

    void serve(int connection) {
        ucred peer{};
        socklen_t size = sizeof peer;
        ::getsockopt(connection, SOL_SOCKET, SO_PEERCRED, &peer, &size);
        caller_ = peer.uid;
        isOver_ = false;
        const int own = ::fcntl(connection, F_DUPFD_CLOEXEC, 3);
        sd_bus* bus = nullptr;
        sd_bus_new(&bus);
        sd_bus_set_fd(bus, own, own);
        sd_bus_set_server(bus, 1, sd_id128_t{});
        sd_bus_add_filter(bus, nullptr, called, this);
        sd_bus_start(bus);
        while (sd_bus_process(bus, nullptr) >= 0 && !isOver_ && sd_bus_wait(bus, UINT64_MAX) >= 0) {
        }
        sd_bus_flush_close_unref(bus);
    }

  private:
    static int called(sd_bus_message* call, void* self, sd_bus_error* /*error*/) {
        // The end of the connection is told as a signal.
        return sd_bus_message_is_method_call(call, nullptr, nullptr) > 0
                   ? static_cast<FakeLogind*>(self)->answer(call)
                   : 0;
    }

    static int refuse(sd_bus_message* call, const char* name, const std::string& text) {
        return sd_bus_reply_method_errorf(call, name, "%s", text.c_str());
    }

    int answer(sd_bus_message* call) {
        const char* const member = sd_bus_message_get_member(call);
        const std::string_view name = member != nullptr ? member : "";
        if (name == "Hello") {
            return sd_bus_reply_method_return(call, "s", ":1.1");
        }
        if (name == lastCall) {
            isOver_ = true;
            return 1;
        }
        if (!error.empty()) {
            return refuse(call, error.c_str(), "Nobody answers here.");
        }
        if (isConfused) {
            return sd_bus_reply_method_return(call, "u", 7);
        }
        if (name == "GetSession") {
            return session(call);
        }
        if (name == "GetUser") {
            return user(call);
        }
        return name == "SetLockedHint" ? setHint(call) : display(call);
    }

    int session(sd_bus_message* call) {
        const char* id = nullptr;
        sd_bus_message_read(call, "s", &id);
        return sessions.contains(id)
                   ? sd_bus_reply_method_return(call, "o", concat(kSessions, id).c_str())
                   : refuse(call, "org.freedesktop.login1.NoSuchSession",
                            concat("No session '", id, "' known"));
    }

    int user(sd_bus_message* call) {
        std::uint32_t user = 0;
        sd_bus_message_read(call, "u", &user);
        return displays.contains(user)
                   ? sd_bus_reply_method_return(call, "o", concat(kUsers, user).c_str())
                   : refuse(call, "org.freedesktop.login1.NoSuchUser",
                            concat("User ID ", user, " is not logged in or lingering"));
    }

    int display(sd_bus_message* call) {
        const std::string path = sd_bus_message_get_path(call);
        const uid_t user = static_cast<uid_t>(std::stoul(path.substr(sizeof kUsers - 1)));
        const std::string id = displays[user];
        return sd_bus_reply_method_return(call, "v", "(so)", id.c_str(),
                                          id.empty() ? "/" : concat(kSessions, id).c_str());
    }

    int setHint(sd_bus_message* call) {
        const std::string path = sd_bus_message_get_path(call);
        const std::string id = path.substr(sizeof kSessions - 1);
        int isLocked = 0;
        sd_bus_message_read(call, "b", &isLocked);
        if (caller_ != 0 && caller_ != sessions[id]) {
            return refuse(call, "org.freedesktop.DBus.Error.AccessDenied",
                          "Only owner of session may set locked hint");
        }
        hints.push_back(concat(id, isLocked != 0 ? " locked" : " unlocked"));
        return sd_bus_reply_method_return(call, "");
    }

    uid_t caller_ = 0;
    bool isOver_ = false;
};

class SessionTest : public KstctlFixture {
  protected:
    SessionTest() {
        fs::create_directories(real("/run/dbus"));
        for (const char* const directory : {"/", "/run", "/run/dbus"}) {
            fs::permissions(real(directory), fs::perms(0755));
        }
    }

    [[nodiscard]] std::string path() const { return real("/run/dbus/system_bus_socket"); }

    [[nodiscard]] PacketServer serve() {
        return PacketServer(path(), SOCK_STREAM, [this](int bus) { logind.serve(bus); });
    }

    /// In the session; in none when that is empty.
    static RunOptions in(const std::string& session) {
        return {.environment = {concat("XDG_SESSION_ID=", session)}};
    }

    FakeLogind logind;
    const uid_t user = ::geteuid();
};

TEST_F(SessionTest, LocksAndUnlocksTheOwnSession) {
    logind.sessions = {{"2", user}, {"5", user}};
    logind.displays = {{user, "5"}};
    PacketServer server = serve();
    for (const char* const command : {"lock", "unlock", "lock"}) {
        const Ran ran = kstctl({command}, in("2"));
        EXPECT_EQ(ran.status, 0);
        EXPECT_EQ(ran.out, "");
    }
    EXPECT_EQ(kstctl({"lock", "--json"}, in("2")).out, "{\"session\":\"2\",\"isLocked\":true}\n");
    EXPECT_EQ(kstctl({"unlock", "--json"}, in("2")).out,
              "{\"session\":\"2\",\"isLocked\":false}\n");
    server.stop();
    EXPECT_EQ(logind.hints, (std::vector<std::string>{"2 locked", "2 unlocked", "2 locked",
                                                      "2 locked", "2 unlocked"}));
}

TEST_F(SessionTest, AServiceOfTheUsersMeansTheSessionThatTheUserSitsAt) {
    logind.sessions = {{"2", user}, {"5", user}};
    logind.displays = {{user, "5"}};
    PacketServer server = serve();
    EXPECT_EQ(kstctl({"lock"}, in("")).status, 0);
    // Of a session that is gone.
    EXPECT_EQ(kstctl({"unlock", "--json"}, in("3")).out,
              "{\"session\":\"5\",\"isLocked\":false}\n");
    server.stop();
    EXPECT_EQ(logind.hints, (std::vector<std::string>{"5 locked", "5 unlocked"}));
}

TEST_F(SessionTest, UserWithoutASession) {
    const std::string none = concat("user ", user, " has no session");
    {
        const PacketServer server = serve();
        expectFailure({"lock"}, 3, none, in(""));
        expectFailure({"lock"}, 3, none, in("2"));
    }
    logind.displays = {{user, ""}};
    {
        const PacketServer server = serve();
        expectFailure({"unlock"}, 3, none, in(""));
    }
    EXPECT_TRUE(logind.hints.empty());
}

TEST_F(SessionTest, OfOthersOnlyRootMay) {
    if (user != 0) {
        GTEST_SKIP() << "needs root, to become somebody else";
    }
    logind.sessions = {{"2", 1000}, {"4", 65534}};
    PacketServer server = serve();
    fs::permissions(path(), fs::perms(0666));
    RunOptions nobody = in("2");
    nobody.user = 65534;
    expectFailure({"lock"}, 4, "logind: Only owner of session may set locked hint", nobody);
    nobody.environment = in("4").environment;
    EXPECT_EQ(kstctl({"lock"}, nobody).status, 0);
    EXPECT_EQ(kstctl({"lock"}, in("2")).status, 0);
    server.stop();
    EXPECT_EQ(logind.hints, (std::vector<std::string>{"4 locked", "2 locked"}));
}

TEST_F(SessionTest, MachineWithoutLogind) {
    const std::string refusal = "logind: Nobody answers here.";
    logind.error = "org.freedesktop.DBus.Error.ServiceUnknown";
    {
        const PacketServer server = serve();
        expectFailure({"lock"}, 3, refusal, in("2"));
        expectFailure({"lock"}, 3, refusal, in(""));
    }
    logind.error = "org.freedesktop.DBus.Error.InteractiveAuthorizationRequired";
    {
        const PacketServer server = serve();
        expectFailure({"lock"}, 4, refusal, in("2"));
    }
    logind.error = "org.freedesktop.DBus.Error.LimitsExceeded";
    const PacketServer server = serve();
    expectFailure({"unlock"}, 1, refusal, in("2"));
}

TEST_F(SessionTest, LogindThatAnswersNonsense) {
    logind.isConfused = true;
    const PacketServer server = serve();
    expectFailure({"lock"}, 5, "logind's answer cannot be understood", in("2"));
    expectFailure({"lock"}, 5, "logind's answer cannot be understood", in(""));
}

TEST_F(SessionTest, BusThatEnds) {
    logind.sessions = {{"2", user}};
    logind.displays = {{user, "2"}};
    for (const char* const call : {"GetSession", "SetLockedHint"}) {
        logind.lastCall = call;
        const PacketServer server = serve();
        expectFailure({"lock"}, 1, "logind: Connection reset by peer", in("2"));
    }
    for (const char* const call : {"GetUser", "Get"}) {
        logind.lastCall = call;
        const PacketServer server = serve();
        expectFailure({"lock"}, 1, "logind: Connection reset by peer", in(""));
    }
    EXPECT_TRUE(logind.hints.empty());
}

TEST_F(SessionTest, MachineWithoutABus) {
    expectFailure({"lock"}, 3, concat("there is no message bus at ", path()), in("2"));
    // As a killed one leaves it.
    { const PacketServer server(path(), nullptr); }
    expectFailure({"unlock"}, 3, concat("there is no message bus at ", path()), in("2"));
    const PacketServer server(path(), nullptr);
    expectFailure({"lock"}, 1, concat(path(), ": Protocol wrong type for socket"), in("2"));
    if (user == 0) {
        fs::permissions(path(), fs::perms(0600));
        RunOptions nobody = in("2");
        nobody.user = 65534;
        expectFailure({"lock"}, 4, concat(path(), ": Permission denied"), nobody);
    }
}

} // namespace
} // namespace kstctl
