// The lines that come to the journal. The program's operator new can refuse, so this is a program
// of its own.

#include "base/UnixAddress.h"
#include "platform/linux/LinuxSystemLog.h"
#include "tests/platform/linux/StandardErrorCapture.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <iterator>
#include <map>
#include <new>
#include <optional>
#include <sched.h>
#include <string>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace {

using platform::LinuxSystemLog;
using platform::LogFields;
using platform::LogLevel;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::UnorderedElementsAre;

constexpr char kSocketPath[] = "/run/systemd/journal/socket";

constexpr char kId[] = "0123456789abcdef0123456789abcdef";

/// Each request for memory ends the program while this is set.
bool refusesMemory = false;

using Fields = std::multimap<std::string, std::string>;

/// The fields of a native journal message: "NAME=value\n", or "NAME\n", the value's length in eight
/// bytes, little-endian, the value and "\n".
std::optional<Fields> parseNative(std::string_view message) {
    Fields fields;
    while (!message.empty()) {
        const std::size_t end = message.find('\n');
        if (end == std::string_view::npos) {
            return std::nullopt;
        }
        const std::string_view head = message.substr(0, end);
        message.remove_prefix(end + 1);
        if (const std::size_t equals = head.find('='); equals != std::string_view::npos) {
            fields.emplace(head.substr(0, equals), head.substr(equals + 1));
            continue;
        }
        std::uint64_t length = 0;
        if (message.size() < sizeof length) {
            return std::nullopt;
        }
        std::memcpy(&length, message.data(), sizeof length);
        message.remove_prefix(sizeof length);
        if (message.size() <= length || message[length] != '\n') {
            return std::nullopt;
        }
        fields.emplace(head, message.substr(0, length));
        message.remove_prefix(length + 1);
    }
    return fields;
}

enum class Journal { listening, gone, absent };

/// Runs `body` in a process of its own that sees an empty /run with a journal's socket in it, and
/// tells what came to that socket and to standard error.
class JournalTest : public testing::Test {
  protected:
    void SetUp() override {
        if (::geteuid() != 0) {
            GTEST_SKIP() << "a private /run needs root";
        }
        socket_ = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        ASSERT_GE(socket_, 0);
        const pid_t probe = ::fork();
        if (probe == 0) {
            ::_exit(enterPrivateRun() ? 0 : 1);
        }
        if (waitFor(probe) != 0) {
            GTEST_SKIP() << "this system does not allow a private mount namespace";
        }
    }

    void TearDown() override { ::close(socket_); }

    void run(Journal journal, const std::function<void(LinuxSystemLog&)>& body) {
        const support::StandardErrorCapture standardError;
        const pid_t child = ::fork();
        if (child == 0) {
            runInChild(journal, body);
        }
        EXPECT_EQ(waitFor(child), 0);
        standardError_ = standardError.lines();
        receive();
    }

    std::string_view identifier_ = "kstd";
    std::vector<Fields> messages_;
    std::vector<std::string> standardError_;

  private:
    static bool enterPrivateRun() {
        return ::unshare(CLONE_NEWNS) == 0 &&
               ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
               ::mount("tmpfs", "/run", "tmpfs", 0, "mode=0755") == 0;
    }

    static int waitFor(pid_t child) {
        int status = 0;
        if (::waitpid(child, &status, 0) != child || !WIFEXITED(status)) {
            return -1;
        }
        return WEXITSTATUS(status);
    }

    [[noreturn]] void runInChild(Journal journal,
                                 const std::function<void(LinuxSystemLog&)>& body) {
        if (!enterPrivateRun()) {
            ::_exit(1);
        }
        LinuxSystemLog log(platform::Paths("/"), identifier_);
        if (journal != Journal::absent) {
            const int listener =
                journal == Journal::listening ? socket_ : ::socket(AF_UNIX, SOCK_DGRAM, 0);
            if (!bindJournal(listener)) {
                ::_exit(2);
            }
            if (journal == Journal::gone) {
                ::close(listener);
            }
        }
        body(log);
        ::_exit(0);
    }

    static bool bindJournal(int socket) {
        std::filesystem::create_directories(std::filesystem::path(kSocketPath).parent_path());
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, kSocketPath);
        return ::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    }

    void receive() {
        std::vector<char> buffer(1U << 20U);
        ssize_t size = 0;
        while ((size = ::recv(socket_, buffer.data(), buffer.size(), MSG_DONTWAIT)) >= 0) {
            const auto fields = parseNative({buffer.data(), static_cast<std::size_t>(size)});
            ASSERT_TRUE(fields.has_value()) << "a malformed message came to the journal";
            messages_.push_back(*fields);
        }
    }

    int socket_ = -1;
};

} // namespace

void* operator new(std::size_t size) {
    if (refusesMemory) {
        ::_exit(4);
    }
    if (void* memory = std::malloc(size == 0 ? 1 : size)) {
        return memory;
    }
    throw std::bad_alloc();
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t /*size*/) noexcept {
    std::free(memory);
}

namespace {

TEST_F(JournalTest, NoLineNeedsMemory) {
    constexpr std::size_t kMax = LinuxSystemLog::kMaxTextSize;
    const std::string mixed = "kstd: a failure of \xe2\x80\xae \xff \t" + std::string(kMax, '\x01');
    for (const Journal journal : {Journal::listening, Journal::gone, Journal::absent}) {
        messages_.clear();
        run(journal, [&mixed](LinuxSystemLog& log) {
            refusesMemory = true;
            for (const std::size_t size : {std::size_t{0}, std::size_t{40}, std::size_t{1024},
                                           std::size_t{1025}, kMax, kMax + 1}) {
                log.write(LogLevel::error, std::string_view(mixed).substr(0, size),
                          {"kstd/Daemon.cpp", 42, "main"});
            }
            refusesMemory = false;
        });
        const bool isJournal = journal == Journal::listening;
        EXPECT_EQ(messages_.size(), isJournal ? 6U : 0U);
        EXPECT_EQ(standardError_.size(), isJournal ? 0U : 6U);
    }
}

TEST_F(JournalTest, LineGoesToTheJournalWithItsFields) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::info, "kstd: main: Entering the main runloop.\n",
                  LogFields{"kstd/Daemon.cpp", 42, "main"});
    });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_THAT(messages_[0],
                UnorderedElementsAre(Pair("MESSAGE", "kstd: main: Entering the main runloop."),
                                     Pair("PRIORITY", "6"), Pair("SYSLOG_IDENTIFIER", "kstd"),
                                     Pair("CODE_FILE", "kstd/Daemon.cpp"), Pair("CODE_LINE", "42"),
                                     Pair("CODE_FUNC", "main")));
    EXPECT_THAT(standardError_, IsEmpty());
}

TEST_F(JournalTest, UnknownPlaceGivesNoFieldsOfIt) {
    run(Journal::listening, [](LinuxSystemLog& log) { log.write(LogLevel::info, "text\n", {}); });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_THAT(messages_[0], UnorderedElementsAre(Pair("MESSAGE", "text"), Pair("PRIORITY", "6"),
                                                   Pair("SYSLOG_IDENTIFIER", "kstd")));
}

std::string identifierOf(const Fields& fields) {
    const auto found = fields.find("SYSLOG_IDENTIFIER");
    return found == fields.end() ? "none" : found->second;
}

TEST_F(JournalTest, LineIsOfTheProgramThatWroteIt) {
    identifier_ = {};
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::info, "as it was started", {});
        std::string name(256, 'p');
        for (char* const given : {name.data(), name.data() + 1, name.data() + 256}) {
            ::program_invocation_short_name = given;
            log.write(LogLevel::info, "renamed", {});
        }
        ::program_invocation_short_name = nullptr;
        log.write(LogLevel::info, "nameless", {});
    });
    std::vector<std::string> identifiers;
    std::transform(messages_.begin(), messages_.end(), std::back_inserter(identifiers),
                   identifierOf);
    const std::string longest(255, 'p');
    EXPECT_THAT(identifiers,
                ElementsAre("platform_linux_journal_test", longest, longest, "none", "none"));
}

TEST_F(JournalTest, LineOfAClassHasItsIdentifier) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::error, "kstd: a failure of x\n", {.messageId = kId});
        log.write(LogLevel::error, "kstd: a failure of x\n", {});
    });
    ASSERT_EQ(messages_.size(), 2U);
    EXPECT_THAT(messages_[0], UnorderedElementsAre(Pair("MESSAGE", "kstd: a failure of x"),
                                                   Pair("MESSAGE_ID", kId), Pair("PRIORITY", "3"),
                                                   Pair("SYSLOG_IDENTIFIER", "kstd")));
    EXPECT_EQ(messages_[1].count("MESSAGE_ID"), 0U);
}

TEST_F(JournalTest, LineOfAnotherProgramHasNoClass) {
    identifier_ = "";
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::error, "kstd: a failure of x\n", {.messageId = kId});
    });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_EQ(messages_[0].count("MESSAGE_ID"), 0U);
}

TEST_F(JournalTest, EachLevelHasItsPriority) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::debug, "debug", {});
        log.write(LogLevel::info, "info", {});
        log.write(LogLevel::notice, "notice", {});
        log.write(LogLevel::warning, "warning", {});
        log.write(LogLevel::error, "error", {});
    });
    std::vector<std::string> priorities;
    for (const Fields& fields : messages_) {
        priorities.push_back(fields.find("MESSAGE")->second + " " +
                             fields.find("PRIORITY")->second);
    }
    EXPECT_THAT(priorities, ElementsAre("debug 7", "info 6", "notice 5", "warning 4", "error 3"));
}

TEST_F(JournalTest, TextCannotAddAField) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        log.write(LogLevel::info, "name\nPRIORITY=0\n", {"file\nPRIORITY=1", 1, "f\nPRIORITY=2"});
    });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_THAT(messages_[0],
                UnorderedElementsAre(Pair("MESSAGE", "name\\nPRIORITY=0"), Pair("PRIORITY", "6"),
                                     Pair("SYSLOG_IDENTIFIER", "kstd"),
                                     Pair("CODE_FILE", "file\nPRIORITY=1"), Pair("CODE_LINE", "1"),
                                     Pair("CODE_FUNC", "f\nPRIORITY=2")));
}

TEST_F(JournalTest, LongTextIsCutThereToo) {
    constexpr std::size_t kMax = LinuxSystemLog::kMaxTextSize;
    run(Journal::listening,
        [](LinuxSystemLog& log) { log.write(LogLevel::info, std::string(kMax + 1, 'x'), {}); });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_EQ(messages_[0].find("MESSAGE")->second, std::string(kMax, 'x') + "...");
}

TEST_F(JournalTest, WithoutAJournalTheLineGoesToStandardError) {
    run(Journal::absent, [](LinuxSystemLog& log) { log.write(LogLevel::info, "text\n", {}); });
    EXPECT_THAT(messages_, IsEmpty());
    EXPECT_THAT(standardError_, ElementsAre("text"));
}

TEST_F(JournalTest, JournalThatDoesNotListenLeavesTheLineToStandardError) {
    run(Journal::gone, [](LinuxSystemLog& log) { log.write(LogLevel::info, "text\n", {}); });
    EXPECT_THAT(messages_, IsEmpty());
    EXPECT_THAT(standardError_, ElementsAre("text"));
}

TEST_F(JournalTest, JournalThatTakesNothingLeavesTheLineToStandardError) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        const int filler = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        const auto address = base::UnixAddress::of(kSocketPath);
        while (::sendto(filler, "F=\n", 3, MSG_DONTWAIT, address->get(), address->size()) == 3) {
        }
        log.write(LogLevel::info, "text\n", {});
    });
    EXPECT_THAT(messages_, testing::Each(testing::ElementsAre(Pair("F", ""))));
    EXPECT_THAT(standardError_, ElementsAre("text"));
}

TEST_F(JournalTest, NoDescriptorIsLeftAndNoneIsNeededForStandardError) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        const int before = ::dup(0);
        ::close(before);
        log.write(LogLevel::info, "first\n", {});
        const int after = ::dup(0);
        if (after != before) {
            ::_exit(3);
        }
        const rlimit none{static_cast<rlim_t>(after), static_cast<rlim_t>(after)};
        ::setrlimit(RLIMIT_NOFILE, &none);
        log.write(LogLevel::info, "second\n", {});
    });
    ASSERT_EQ(messages_.size(), 1U);
    EXPECT_THAT(standardError_, ElementsAre("second"));
}

TEST_F(JournalTest, JournalMayGoAndComeBack) {
    run(Journal::listening, [](LinuxSystemLog& log) {
        const std::string aside = std::string(kSocketPath) + ".aside";
        log.write(LogLevel::info, "first", {});
        std::filesystem::rename(kSocketPath, aside);
        log.write(LogLevel::info, "second", {});
        std::filesystem::rename(aside, kSocketPath);
        log.write(LogLevel::info, "third", {});
    });
    ASSERT_EQ(messages_.size(), 2U);
    EXPECT_EQ(messages_[0].find("MESSAGE")->second, "first");
    EXPECT_EQ(messages_[1].find("MESSAGE")->second, "third");
    EXPECT_THAT(standardError_, ElementsAre("second"));
}

} // namespace
