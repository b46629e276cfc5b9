#include "keystrand-linux/MachineSwitches.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "tests/support/MemoryScan.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

namespace keystrand::usb {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;

constexpr uid_t kWith = 1000;
constexpr uid_t kWithout = 1001;
constexpr uid_t kAlsoWithout = 1002;
constexpr uid_t kOfADirectory = 70000;

class MachineSwitchesTest : public testing::Test, public GateLog {
  protected:
    MachineSwitchesTest() {
        for (const char* each : {"etc", "proc"}) {
            fs::create_directories(directory.path() / each);
        }
        put("etc/passwd", "root:x:0:0:root:/root:/bin/sh\n"
                          "with:x:1000:1000::/home/with:/bin/sh\n"
                          "without:x:1001:1001::/home/without:/bin/sh\n"
                          "also:x:1002:1002::/home/also:/bin/sh\n");
        put("etc/shadow", "root:*:19000:0:99999:7:::\n"
                          "with:$y$j9T$abc:19000:0:99999:7:::\n"
                          "without::19000:0:99999:7:::\n"
                          "also::19000:0:99999:7:::\n");
        put("proc/cmdline", "BOOT_IMAGE=/vmlinuz root=/dev/sda1 quiet\n");
    }

    void write(GateLine /*about*/, const std::string& text) override { lines.push_back(text); }

    void put(const std::string& path, std::string_view text) const {
        std::ofstream(directory.path() / path, std::ios::binary | std::ios::trunc) << text;
    }
    [[nodiscard]] std::string lastUsers() const {
        std::string problem;
        return file.read(problem).value_or("none");
    }
    [[nodiscard]] MachineSwitches restarted() {
        return {directory.path().string(), file, *this, [this] {
                    return active;
                }};
    }
    [[nodiscard]] bool passwordSetFor(std::vector<uid_t> users) {
        active = std::move(users);
        return switches.read().passwordSet;
    }

    const support::TemporaryDirectory directory;
    const StateFile file{directory.file("last-user"), StateFile::Durability::synced};
    std::vector<uid_t> active;
    Lines lines;
    MachineSwitches switches = restarted();
};

TEST_F(MachineSwitchesTest, NobodyWasEverThere) {
    EXPECT_EQ(switches.read(), PolicySwitches());
    EXPECT_TRUE(switches.read().passwordSet);
    EXPECT_EQ(lastUsers(), "none");
    EXPECT_EQ(lines, Lines());
}

TEST_F(MachineSwitchesTest, OnlyAnEmptyFieldIsNoPassword) {
    EXPECT_TRUE(passwordSetFor({kWith}));
    EXPECT_FALSE(passwordSetFor({kWithout}));
    EXPECT_TRUE(passwordSetFor({0}));
    EXPECT_TRUE(passwordSetFor({kOfADirectory}));
    for (const char* line : {"without:!:1::::::", "without", "without:", "without::", "other::1",
                             "xwithout::1", "without :::", " without::1", "# without::1", ""}) {
        put("etc/shadow", base::concat("root:*:1\n", line, "\n"));
        EXPECT_EQ(passwordSetFor({kWithout}), std::string_view(line) != "without::") << line;
    }
    put("etc/shadow", "without::1");
    EXPECT_FALSE(passwordSetFor({kWithout}));
    EXPECT_EQ(lines, Lines());
}

TEST_F(MachineSwitchesTest, UserWhoIsNotInOneOfTheFilesHasAPassword) {
    put("etc/shadow", "with:x:1\n");
    EXPECT_TRUE(passwordSetFor({kWithout}));
    put("etc/shadow", "without::1\n");
    put("etc/passwd", "with:x:1000:1000\nwithout:x:10010:1\nwithout:x::1\nwithout:x:1001x:1\n");
    EXPECT_TRUE(passwordSetFor({kWithout}));
    put("etc/passwd", "without:x:1001");
    EXPECT_FALSE(passwordSetFor({kWithout}));
}

TEST_F(MachineSwitchesTest, UserWithTwoNamesNeedsBothWithout) {
    put("etc/passwd", "without:x:1001:1\nagain:x:1001:1\n");
    EXPECT_TRUE(passwordSetFor({kWithout}));
    put("etc/shadow", "without::1\nagain:hash:1\n");
    EXPECT_TRUE(passwordSetFor({kWithout}));
    put("etc/shadow", "without::1\nagain::1\n");
    EXPECT_FALSE(passwordSetFor({kWithout}));
    put("etc/shadow", "without::1\nagain::1\nwithout:hash:1\n");
    EXPECT_TRUE(passwordSetFor({kWithout}));
}

TEST_F(MachineSwitchesTest, LinesAndFilesOfAnySize) {
    const std::string hash(100000, 'h');
    put("etc/shadow", base::concat("with:", hash, ":1\n", hash, "::1\nwithout::1\n"));
    EXPECT_TRUE(passwordSetFor({kWith}));
    EXPECT_FALSE(passwordSetFor({kWithout}));
    // The fields at each place of the pieces in which the file is read.
    for (std::size_t before = 4080; before < 4100; ++before) {
        put("etc/shadow", base::concat(std::string(before - 1, 'x'), "\nwithout::1:2\n"));
        EXPECT_FALSE(passwordSetFor({kWithout})) << before;
    }
}

TEST_F(MachineSwitchesTest, EachOfSeveralSeatsMustBeWithout) {
    EXPECT_TRUE(passwordSetFor({kWithout, kWith}));
    EXPECT_TRUE(passwordSetFor({kWith, kWithout}));
    EXPECT_FALSE(passwordSetFor({kAlsoWithout, kWithout}));
    EXPECT_EQ(lastUsers(), "1001\n1002\n");
}

TEST_F(MachineSwitchesTest, WhoeverWasThereLastCountsWhileNobodyIs) {
    EXPECT_FALSE(passwordSetFor({kWithout}));
    EXPECT_EQ(lastUsers(), "1001\n");
    EXPECT_FALSE(passwordSetFor({}));
    EXPECT_FALSE(restarted().read().passwordSet);
    EXPECT_TRUE(passwordSetFor({kWith}));
    EXPECT_EQ(lastUsers(), "1000\n");
    EXPECT_TRUE(passwordSetFor({}));
    EXPECT_TRUE(restarted().read().passwordSet);
    // A password that is set meanwhile counts at once.
    EXPECT_FALSE(passwordSetFor({kWithout}));
    put("etc/shadow", "without:hash:1\n");
    EXPECT_TRUE(passwordSetFor({}));
}

TEST_F(MachineSwitchesTest, FileIsWrittenOnlyWhenAnotherIsThere) {
    EXPECT_FALSE(passwordSetFor({kWithout}));
    fs::remove(directory.file("last-user"));
    EXPECT_FALSE(passwordSetFor({kWithout}));
    EXPECT_EQ(lastUsers(), "none");
    EXPECT_TRUE(passwordSetFor({kWith}));
    EXPECT_EQ(lastUsers(), "1000\n");
}

TEST_F(MachineSwitchesTest, FileThatIsNoListOfUsersIsNobody) {
    for (const char* text : {"1001", "without\n", "-1\n", "1001\n\n", "4294967296\n", "1001 \n"}) {
        lines.clear();
        put("last-user", text);
        EXPECT_TRUE(restarted().read().passwordSet) << text;
        EXPECT_EQ(lines, Lines{base::concat("keystrand: ", file.path(),
                                            ": not a list of users; whoever was active last counts "
                                            "as having a password")})
            << text;
    }
    std::string most;
    for (int user = 0; user < 64; ++user) {
        most += "1001\n";
    }
    put("last-user", most);
    EXPECT_FALSE(restarted().read().passwordSet);
    put("last-user", most + "1001\n");
    EXPECT_TRUE(restarted().read().passwordSet);
}

TEST_F(MachineSwitchesTest, FilesThatCannotBeReadAreSaidOnce) {
    fs::remove(directory.file("etc/shadow"));
    EXPECT_TRUE(passwordSetFor({kWithout}));
    EXPECT_TRUE(passwordSetFor({kWithout}));
    EXPECT_EQ(lines, Lines{base::concat("keystrand: ", directory.file("etc/shadow"),
                                        ": No such file or directory; every user counts as having "
                                        "a password")});
    lines.clear();
    fs::create_directory(directory.file("etc/shadow"));
    EXPECT_TRUE(passwordSetFor({kWithout}));
    EXPECT_EQ(lines, Lines{base::concat("keystrand: ", directory.file("etc/shadow"),
                                        ": Is a directory; every user counts as having a "
                                        "password")});
    lines.clear();
    fs::remove(directory.file("etc/passwd"));
    EXPECT_TRUE(passwordSetFor({kWithout}));
    EXPECT_EQ(lines.size(), 1U);
}

TEST_F(MachineSwitchesTest, LastUserThatCannotBeKeptIsSaidAndHoldsUntilTheEnd) {
    const StateFile nowhere(directory.file("none/last-user"), StateFile::Durability::none);
    MachineSwitches without(directory.path().string(), nowhere, *this, [this] { return active; });
    active = {kWithout};
    EXPECT_FALSE(without.read().passwordSet);
    active = {};
    EXPECT_FALSE(without.read().passwordSet);
    EXPECT_EQ(lines, Lines{base::concat("keystrand: ", nowhere.path(),
                                        ": cannot be written: No such file or directory; after "
                                        "a restart nobody knows who was active last")});
}

TEST_F(MachineSwitchesTest, WordOfTheCommandLine) {
    EXPECT_FALSE(switches.read().bootArgument);
    for (const char* text :
         {"keystrand.restricted_mode=off", "a keystrand.restricted_mode=off\n",
          "keystrand.restricted_mode=off b\n", "a\tkeystrand.restricted_mode=off\tb"}) {
        put("proc/cmdline", text);
        EXPECT_TRUE(switches.read().bootArgument) << text;
    }
    for (const char* text : {"", "keystrand.restricted_mode=on", "keystrand.restricted_mode=off1",
                             "xkeystrand.restricted_mode=off", "keystrand.restricted_mode = off",
                             "restricted_mode=off", "a=keystrand.restricted_mode=off"}) {
        put("proc/cmdline", text);
        EXPECT_FALSE(switches.read().bootArgument) << text;
    }
    fs::remove(directory.file("proc/cmdline"));
    EXPECT_FALSE(switches.read().bootArgument);
    EXPECT_EQ(lines, Lines());
}

TEST_F(MachineSwitchesTest, NoHashStaysInMemory) {
    // The secret with its bits turned round; the file is written without a copy of it.
    constexpr support::MemoryScan::Turned kTurned = {0x8e, 0xc8, 0xa5, 0x8f, 0xcb, 0xb3,
                                                     0x88, 0xc6, 0xa7, 0x94, 0xcd, 0xa9,
                                                     0x9d, 0xc9, 0xb1, 0x9b};
    put("etc/shadow", "without::1\nwith:");
    const base::FileDescriptor shadow(
        ::open(directory.file("etc/shadow").c_str(), O_WRONLY | O_APPEND | O_CLOEXEC));
    for (const std::uint8_t turned : kTurned) {
        const auto byte = static_cast<std::uint8_t>(~turned);
        ASSERT_EQ(::write(shadow.get(), &byte, 1), 1);
    }
    ASSERT_EQ(::write(shadow.get(), ":1\n", 3), 3);
    active = {kWith};
    const std::size_t before = std::make_unique<support::MemoryScan>(kTurned)->places();
    EXPECT_TRUE(switches.read().passwordSet);
    EXPECT_EQ(before, 0U);
    EXPECT_EQ(std::make_unique<support::MemoryScan>(kTurned)->places(), 0U);
}

/// The files in which logind says who sits where, of a machine that this process has for itself.
class UsersAtTheSeatsTest : public testing::Test {
  protected:
    void SetUp() override {
        if (::unshare(CLONE_NEWNS) != 0 ||
            ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
            ::mount("none", "/run", "tmpfs", 0, nullptr) != 0) {
            GTEST_SKIP() << "a mount cannot be made here";
        }
    }

    static void put(const std::string& path, std::string_view text) {
        const fs::path whole = fs::path("/run/systemd") / path;
        fs::create_directories(whole.parent_path());
        std::ofstream(whole) << text;
    }
    static void seat(const std::string& name, const std::string& session, uid_t user) {
        put("seats/" + name, base::concat("IS_SEAT0=0\nACTIVE=", session, "\nACTIVE_UID=", user,
                                          "\nSESSIONS=", session, "\n"));
    }
    static void session(const std::string& name, const std::string& kind,
                        const std::string& state) {
        put("sessions/" + name, base::concat("UID=1\nCLASS=", kind, "\nSTATE=", state, "\n"));
    }
};

using Users = std::vector<uid_t>;

TEST_F(UsersAtTheSeatsTest, MachineWithoutSeatsHasNone) {
    EXPECT_EQ(usersAtTheSeats(), Users());
    put("seats/seat0", "IS_SEAT0=1\nCAN_GRAPHICAL=1\n");
    EXPECT_EQ(usersAtTheSeats(), Users());
}

TEST_F(UsersAtTheSeatsTest, ActiveSessionsOfEachSeat) {
    seat("seat0", "c1", 1000);
    session("c1", "user", "active");
    seat("seat1", "7", 1001);
    session("7", "user", "active");
    Users users = usersAtTheSeats();
    std::sort(users.begin(), users.end());
    EXPECT_EQ(users, (Users{1000, 1001}));
}

TEST_F(UsersAtTheSeatsTest, GreetersAndWhatIsClosingHaveNone) {
    seat("seat0", "c1", 110);
    session("c1", "greeter", "active");
    EXPECT_EQ(usersAtTheSeats(), Users());
    session("c1", "user", "closing");
    EXPECT_EQ(usersAtTheSeats(), Users());
    // The session is gone already.
    fs::remove("/run/systemd/sessions/c1");
    EXPECT_EQ(usersAtTheSeats(), Users());
    session("c1", "user", "active");
    EXPECT_EQ(usersAtTheSeats(), Users{110});
}

} // namespace
} // namespace keystrand::usb
