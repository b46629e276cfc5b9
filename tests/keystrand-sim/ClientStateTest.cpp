// What clients put in, seen through the control socket.

#include "base/ByteReader.h"
#include "tests/keystrand-sim/SimulatorProcess.h"
#include "tests/keystrand/Credentials.h"

#include <cerrno>
#include <fcntl.h>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

namespace keystrand::sim::test {

using namespace keystrand::test;

namespace {

using Lines = std::vector<std::string>;

std::string hexOf(const ByteVector& bytes) {
    constexpr char kDigits[] = "0123456789abcdef";
    std::string text;
    for (const std::uint8_t byte : bytes) {
        text += kDigits[byte >> 4U];
        text += kDigits[byte & 15U];
    }
    return text;
}

class ClientStateTest : public SimulatorProcess {
  protected:
    void SetUp() override {
        SimulatorProcess::SetUp();
        start();
        client_.emplace(openClient());
    }

    std::string write(const std::string& text) {
        std::string file = path("policies.conf");
        std::ofstream(file, std::ios::binary) << text;
        return file;
    }

    /// The body of a reply with status 0.
    ByteVector ask(std::uint8_t code, const ByteVector& payload) {
        const ByteVector packet = call(*client_, frame(code, payload));
        EXPECT_GE(packet.size(), 24U);
        const ByteVector body(packet.begin() + 24, packet.end());
        EXPECT_EQ(packet, reply(5, 2, 0, static_cast<std::uint32_t>(body.size()), body));
        return body;
    }
    std::int32_t statusOf(std::uint8_t code, const ByteVector& payload) {
        const ByteVector packet = call(*client_, frame(code, payload));
        base::ByteReader reader(packet);
        std::uint32_t bits = 0;
        EXPECT_TRUE(reader.skip(16) && reader.readU32(bits));
        return static_cast<std::int32_t>(bits);
    }

    ByteVector createContext() {
        ByteVector handle = ask(1, {});
        EXPECT_EQ(handle.size(), 17U);
        EXPECT_EQ(handle.back(), 40);
        handle.pop_back();
        return handle;
    }

    std::string reasonOf(const std::string& line) { return control_->command(line).reason; }

    std::optional<PacketSocket> client_;
};

TEST_F(ClientStateTest, ContextsAndTheirCredentials) {
    EXPECT_EQ(tell("contexts").lines, Lines());
    const ByteVector handle = createContext();
    ask(5, Bytes().bytes(handle).bytes(passphrase("secret", 0, 1000)).u32(1));
    tell("clock advance 30");
    ask(5, Bytes().bytes(handle).bytes(plainCredential(4)).u32(1));
    ask(5, Bytes().fill(16, 0).bytes(plainCredential(12)).u32(2));
    ask(22, Bytes().bytes(handle).u32(7).u8(1));
    EXPECT_EQ(tell("contexts").lines,
              Lines{"context " + hexOf(handle) + " credentials 2 properties 1"});
    EXPECT_EQ(tell("credentials " + hexOf(handle)).lines,
              (Lines{"credential type 2 length 168 user 1000 age 30",
                     "credential type 4 length 32 user none age 0"}));
    EXPECT_EQ(tell("credentials").lines, Lines{"credential type 12 length 40 user none age 0"});
    const auto status = tell("status");
    EXPECT_EQ(status.value("contexts"), "1");
    EXPECT_EQ(status.value("global-credentials"), "1");
    EXPECT_EQ(status.value("policies"), "0");
    EXPECT_EQ(reasonOf("credentials 00"), "context: not 16 bytes");
    EXPECT_EQ(reasonOf("credentials " + std::string(32, '0')), "absent");
}

TEST_F(ClientStateTest, PoliciesAreLoadedAndListed) {
    EXPECT_EQ(reasonOf("policies reload"), "no file was loaded");
    const std::string file = write("policy b = never\npolicy a = any-of(passcode(age=5), never)");
    tell("policies load " + file);
    EXPECT_EQ(tell("policies").lines,
              (Lines{"policy a = any-of(passcode(age=5), never)", "policy b = never"}));
    write("policy b = \nnever never");
    EXPECT_EQ(reasonOf("policies reload"), file + ":2: policy expected before never");
    EXPECT_EQ(tell("policies").lines.size(), 2U);
    write("policy c = marker-4");
    tell("policies reload");
    EXPECT_EQ(tell("policies").lines, Lines{"policy c = marker-4"});
}

TEST_F(ClientStateTest, TreeHasToFitIntoWhatIsOffered) {
    tell("policies load " + write("policy a = never"));
    const ByteVector handle = createContext();
    const ByteVector question = frame(3, Bytes().bytes(handle).text("a").fill(10, 0));
    EXPECT_EQ(exchange(*client_, structCall(2, 19, question)), reply(5, 2, -6008, 0));
    EXPECT_EQ(exchange(*client_, structCall(2, 20, question)),
              reply(5, 2, 0, 20, Bytes().u32(0).u32(16).u32(1).u64(0)));
}

TEST_F(ClientStateTest, EveryCommandHasItsFaults) {
    const ByteVector handle = createContext();
    for (const int code : {1, 2, 3, 4, 5, 6, 9, 11, 13, 15, 16, 18, 19, 20, 21, 22}) {
        SCOPED_TRACE(code);
        const std::string command = "fault command=" + std::to_string(code);
        tell(command + " status=-42");
        tell(command + " reply=3");
        const ByteVector input = frame(static_cast<std::uint8_t>(code), handle);
        EXPECT_EQ(call(*client_, input), reply(5, 2, -42, 0));
        EXPECT_EQ(call(*client_, input), reply(5, 2, 0, 3, {1, 2, 3}));
    }
    EXPECT_EQ(tell("contexts").lines.size(), 1U);
    tell("fault command=2 status=-42 perform");
    EXPECT_EQ(call(*client_, frame(2, handle)), reply(5, 2, -42, 0));
    EXPECT_EQ(tell("contexts").lines.size(), 0U);
}

TEST_F(ClientStateTest, LogKeepsNoCredentials) {
    const ByteVector handle(16, 0xab);
    const std::string shown = " payload " + hexOf(handle);
    const ByteVector add = Bytes().bytes(handle).bytes(passphrase("secret")).u32(1);
    for (const std::uint8_t code : ByteVector{5, 6, 15}) {
        EXPECT_EQ(statusOf(code, add), -6010);
    }
    EXPECT_EQ(statusOf(5, ByteVector(add.begin(), add.begin() + 100)), -6007);
    EXPECT_EQ(statusOf(5, Bytes().bytes(handle).text("secret")), -6007);
    EXPECT_EQ(statusOf(5, Bytes().text("short")), -6007);
    exchange(*client_, request(5, 2, Bytes().u32(1).u32(0).bytes(frame(5, add))));
    EXPECT_EQ(tell("requests").lines,
              (Lines{"request 1 command 5" + shown + " credential 2 withheld 172 status -6010",
                     "request 2 command 6" + shown + " credential 2 withheld 172 status -6010",
                     "request 3 command 15" + shown + " credential 2 withheld 172 status -6010",
                     "request 4 command 5" + shown + " credential 2 withheld 84 status -6007",
                     "request 5 command 5" + shown + " withheld 6 status -6007",
                     "request 6 command 5 payload 73686f7274 status -6007",
                     "request 7 command none payload 44524353050000aa" + hexOf(handle) +
                         " credential 2 withheld 172 status -6004"}));
}

/// How often the bytes are in the memory that the process can write to; none when it cannot be
/// looked at.
std::optional<std::size_t> placesIn(pid_t pid, std::string_view wanted) {
    const std::string process = "/proc/" + std::to_string(pid);
    const int memory = ::open((process + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
    if (memory < 0) {
        return std::nullopt;
    }
    std::size_t found = 0;
    std::ifstream maps(process + "/maps");
    for (std::string line; std::getline(maps, line);) {
        std::uint64_t begin = 0;
        std::uint64_t end = 0;
        char access[5] = {};
        constexpr std::uint64_t kLargestMapping = std::uint64_t{1} << 25U;
        if (std::sscanf(line.c_str(), "%lx-%lx %4s", &begin, &end, access) != 3 ||
            std::string_view(access).substr(0, 2) != "rw" || end - begin > kLargestMapping) {
            continue;
        }
        std::string bytes(end - begin, '\0');
        const ssize_t got = ::pread(memory, bytes.data(), bytes.size(), static_cast<off_t>(begin));
        bytes.resize(got > 0 ? static_cast<std::size_t>(got) : 0);
        for (std::size_t at = bytes.find(wanted); at != std::string::npos;
             at = bytes.find(wanted, at + 1)) {
            ++found;
        }
    }
    ::close(memory);
    return found;
}

TEST_F(ClientStateTest, NoCopyOfACredentialIsLeftWhenItWasRemoved) {
    constexpr std::string_view kSecret = "V9wq-zT4x.Lm17#e";
    const ByteVector handle = createContext();
    const auto places = [&] {
        return placesIn(program_->pid(), kSecret);
    };
    if (!places()) {
        GTEST_SKIP() << "the memory of another process cannot be read here";
    }
    ASSERT_EQ(places(), 0U);
    ask(5, Bytes().bytes(handle).bytes(passphrase(kSecret)).u32(1));
    EXPECT_EQ(places(), 1U);
    ask(5, Bytes().bytes(handle).bytes(passphrase(kSecret)).u32(2));
    EXPECT_EQ(places(), 2U);
    ask(6, Bytes().bytes(handle).bytes(passphrase(kSecret)).u32(2));
    EXPECT_EQ(places(), 1U);
    ask(2, handle);
    EXPECT_EQ(places(), 0U);
    EXPECT_EQ(statusOf(5, Bytes().bytes(handle).bytes(passphrase(kSecret)).u32(1)), -6010);
    EXPECT_EQ(places(), 0U);
}

} // namespace

} // namespace keystrand::sim::test
