#include "keystrand-linux/GateRecord.h"

#include "keystrand-linux/StateFile.h"
#include "tests/support/FailingCalls.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace keystrand::usb {
namespace {

using namespace std::chrono_literals;

GateRecord full() {
    GateRecord record;
    record.service = {.restricted = true, .starting = true, .openUntil = 77us};
    record.replacesLost = true;
    record.gate.phase = GateState::Phase::closed;
    record.gate.parameter = WrittenDefault{.before = -1, .written = 2, .confirmed = true};
    record.gate.hubs = {{.bus = 1, .inode = 12, .value = {.before = 1, .written = 2}},
                        {.bus = 2, .inode = 13, .value = {.before = 0, .written = 0}}};
    record.gate.devices = {{.attachment = {"1-2.3", 5, 99},
                            .standing = Standing::keyboardHub,
                            .since = 5s,
                            .confirmed = false},
                           {.attachment = {"2-1", 6, 100}, .standing = Standing::refused}};
    return record;
}

TEST(GateRecordTest, Bytes) {
    EXPECT_EQ(encodeGateRecord(full()), "keystrand-gate 1\n"
                                        "phase closed\n"
                                        "restricted\n"
                                        "starting\n"
                                        "open-until 77\n"
                                        "replaces-lost\n"
                                        "parameter -1 2 done\n"
                                        "hub 1 12 1 2 decided\n"
                                        "hub 2 13 0 0 decided\n"
                                        "device 1-2.3 5 99 keyboard-hub 5000000 decided\n"
                                        "device 2-1 6 100 refused 0 done\n"
                                        "end\n");
}

TEST(GateRecordTest, ComesBackTheSame) {
    EXPECT_EQ(decodeGateRecord(encodeGateRecord(full())), full());
    EXPECT_EQ(decodeGateRecord(encodeGateRecord({})), GateRecord());
    for (const auto phase :
         {GateState::Phase::open, GateState::Phase::closed, GateState::Phase::opening}) {
        const GateRecord record{.gate = {.phase = phase, .hubs = {}, .devices = {}}};
        EXPECT_EQ(decodeGateRecord(encodeGateRecord(record)), record);
    }
}

TEST(GateRecordTest, EachStandingHasAName) {
    for (int number = 0; number <= static_cast<int>(Standing::refusedByOthers); ++number) {
        const auto standing = static_cast<Standing>(number);
        EXPECT_EQ(standingNamed(nameOf(standing)), standing);
    }
    EXPECT_EQ(standingNamed("other"), std::nullopt);
}

TEST(GateRecordTest, NothingShorterIsARecord) {
    const std::string text = encodeGateRecord(full());
    for (std::size_t size = 0; size < text.size(); ++size) {
        EXPECT_EQ(decodeGateRecord(text.substr(0, size)), std::nullopt) << size;
    }
    EXPECT_EQ(decodeGateRecord(text + "\n"), std::nullopt);
    EXPECT_EQ(decodeGateRecord(text + text), std::nullopt);
}

TEST(GateRecordTest, AnythingElseIsNone) {
    const std::string text = encodeGateRecord(full());
    const auto with = [&](const std::string& what, const std::string& by) {
        std::string other = text;
        other.replace(other.find(what), what.size(), by);
        return decodeGateRecord(other);
    };
    ASSERT_EQ(with("restricted", "restricted"), full());
    EXPECT_EQ(with("gate 1", "gate 2"), std::nullopt);
    EXPECT_EQ(with("closed", "shut"), std::nullopt);
    EXPECT_EQ(with("done", "maybe"), std::nullopt);
    EXPECT_EQ(with("-1 2", "-1 x"), std::nullopt);
    EXPECT_EQ(with("1 12 1", "1 012 1"), std::nullopt);
    EXPECT_EQ(with("1 12 1", "1  12 1"), std::nullopt);
    EXPECT_EQ(with("12 1 2", "12 1 2 3"), std::nullopt);
    EXPECT_EQ(with("hub 1", "hub 4294967296"), std::nullopt);
    EXPECT_EQ(with("keyboard-hub", "keyboards"), std::nullopt);
    EXPECT_EQ(with("restricted\n", "restricted\nrestricted\n"), std::nullopt);
    EXPECT_EQ(with("restricted\n", "other\n"), std::nullopt);
}

TEST(KnownDevicesTest, ComeBackTheSame) {
    const KnownDevices devices = {{.controller = "/devices/pci0000:00/0000:00:14.0",
                                   .path = "2.3",
                                   .vendor = 65535,
                                   .product = 0,
                                   .descriptorsHash = 0xFFFFFFFFFFFFFFFF,
                                   .serial = std::string("\n \0\xff", 4)},
                                  {.controller = "x",
                                   .path = "1",
                                   .vendor = 1,
                                   .product = 2,
                                   .descriptorsHash = 3,
                                   .serial = {}}};
    const std::string text = encodeKnownDevices(devices);
    EXPECT_EQ(text, "keystrand-devices 1\n"
                    "device 2f646576696365732f706369303030303a30302f303030303a30303a31342e30 2.3 "
                    "65535 0 18446744073709551615 0a2000ff\n"
                    "device 78 1 1 2 3 -\n"
                    "end\n");
    EXPECT_EQ(decodeKnownDevices(text), devices);
    for (std::size_t size = 0; size < text.size(); ++size) {
        EXPECT_EQ(decodeKnownDevices(text.substr(0, size)), std::nullopt) << size;
    }
    EXPECT_EQ(decodeKnownDevices(encodeKnownDevices({})), KnownDevices());
}

TEST(KnownDevicesTest, AnythingElseIsNone) {
    const auto read = [](const std::string& line) {
        return decodeKnownDevices("keystrand-devices 1\n" + line + "\nend\n");
    };
    const KnownAcrossStarts device{.controller = "xy",
                                   .path = "1",
                                   .vendor = 1,
                                   .product = 2,
                                   .descriptorsHash = 3,
                                   .serial = "z"};
    ASSERT_EQ(read("device 7879 1 1 2 3 7a"), KnownDevices{device});
    for (const char* line : {
             "gadget 7879 1 1 2 3 7a",
             "device g879 1 1 2 3 7a",
             "device 7g79 1 1 2 3 7a",
             "device 787 1 1 2 3 7a",
             "device 7879 1 65536 2 3 7a",
             "device 7879 1 1 2 3 7A",
             "device 7879 1 1 2 3 7a0",
             "device 7879 1 1 2 3 7a more",
             "device 7879 1 1 2 3",
             "device  1 1 2 3 7a",
             "",
         }) {
        EXPECT_EQ(read(line), std::nullopt) << line;
    }
    EXPECT_EQ(decodeKnownDevices("end\n"), std::nullopt);
    EXPECT_EQ(decodeKnownDevices("keystrand-devices 2\nend\n"), std::nullopt);
}

TEST(KnownDevicesTest, PlaceIsBehindTheController) {
    UsbDevice device;
    device.attachment.port = "3-1.4";
    device.controller = "c";
    device.serial = "s";
    const KnownAcrossStarts known = acrossStarts(device);
    EXPECT_EQ(known.path, "1.4");
    EXPECT_EQ(known.controller, "c");
    EXPECT_EQ(known.serial, "s");
}

class StateFileTest : public testing::TestWithParam<StateFile::Durability> {
  protected:
    support::TemporaryDirectory directory;
    StateFile file{directory.file("state"), GetParam()};
    std::string problem;
};

TEST_P(StateFileTest, IsReplacedAsAWhole) {
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, "");
    EXPECT_TRUE(file.replace("one", problem));
    EXPECT_EQ(file.read(problem), "one");
    // What a service that was killed left does not matter.
    std::ofstream(file.path() + ".new") << "half";
    EXPECT_TRUE(file.replace("two", problem));
    EXPECT_EQ(file.read(problem), "two");
    EXPECT_FALSE(std::filesystem::exists(file.path() + ".new"));
    struct stat status {};
    ASSERT_EQ(::stat(file.path().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
    EXPECT_TRUE(file.remove(problem));
    EXPECT_TRUE(file.remove(problem));
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, "");
}

TEST_P(StateFileTest, WhatIsNoFileIsTold) {
    std::filesystem::create_directory(file.path());
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, file.path() + ": not a regular file");
    EXPECT_FALSE(file.replace("x", problem));
    EXPECT_EQ(problem, file.path() + ": cannot be written: Is a directory");
    EXPECT_FALSE(std::filesystem::exists(file.path() + ".new"));
    EXPECT_FALSE(file.remove(problem));
    EXPECT_EQ(problem, file.path() + ": cannot be removed: Is a directory");
}

TEST_P(StateFileTest, LinkIsNotFollowed) {
    const std::string other = directory.file("other");
    std::ofstream(other) << "secret";
    ASSERT_EQ(::symlink(other.c_str(), file.path().c_str()), 0);
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, file.path() + ": cannot be opened: Too many levels of symbolic links");
    EXPECT_TRUE(file.replace("x", problem));
    EXPECT_FALSE(std::filesystem::is_symlink(file.path()));
}

TEST_P(StateFileTest, ReadsThatFail) {
    ASSERT_TRUE(file.replace("one", problem));
    support::FailingCalls::read = {EINTR};
    EXPECT_EQ(file.read(problem), "one");
    EXPECT_EQ(problem, "");
    support::FailingCalls::read = {EIO};
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, file.path() + ": cannot be read: Input/output error");
    support::FailingCalls::fstat = {EIO};
    EXPECT_EQ(file.read(problem), std::nullopt);
    EXPECT_EQ(problem, file.path() + ": not a regular file");
}

TEST_P(StateFileTest, SizeHasALimit) {
    for (const auto size : {StateFile::kMaxSize, StateFile::kMaxSize + 1}) {
        ASSERT_TRUE(file.replace(std::string(size, 'x'), problem));
        EXPECT_EQ(file.read(problem).has_value(), size == StateFile::kMaxSize);
    }
    EXPECT_EQ(problem, file.path() + ": too large");
}

INSTANTIATE_TEST_SUITE_P(Both, StateFileTest,
                         testing::Values(StateFile::Durability::none,
                                         StateFile::Durability::synced));

} // namespace
} // namespace keystrand::usb
