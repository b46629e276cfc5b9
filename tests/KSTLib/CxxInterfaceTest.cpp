// What C++ has beside the functions, without a kernel service.

#include "KSTLib/KSTLib.hpp"
#include "base/NotCopied.h"
#include "tests/KSTLib/ChannelFixture.h"
#include "tests/common/RequirementSamples.h"

#include <gtest/gtest.h>

#include <array>
#include <chrono>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <functional>
#include <pty.h>
#include <sched.h>
#include <string>
#include <sys/wait.h>
#include <termios.h>
#include <thread>
#include <vector>

namespace {

using support::asRequirement;
using support::compositeBytes;
using support::compositeInMemory;
using support::leafBytes;

std::string textOf(const kst::Passphrase& passphrase) {
    return {reinterpret_cast<const char*>(passphrase.data()), passphrase.size()};
}

static_assert(!std::is_copy_constructible_v<kst::Passphrase>);
static_assert(!std::is_copy_constructible_v<kst::Credential>);
static_assert(!std::is_copy_constructible_v<kst::Context>);
static_assert(std::is_nothrow_move_constructible_v<kst::Passphrase>);
static_assert(std::is_nothrow_move_constructible_v<kst::Credential>);
static_assert(std::is_nothrow_move_assignable_v<kst::Context>);
static_assert(std::is_nothrow_move_constructible_v<kst::Requirement>);
static_assert(noexcept(std::declval<kst::Context&>().verify("")));
static_assert(noexcept(std::declval<kst::Context&>().add(std::declval<kst::Credential&>())));

TEST(CxxErrors, EveryStatusIsAnErrorOfItsOwn) {
    EXPECT_FALSE(kst::errorOf(kKSTErrorSuccess));
    for (const KSTStatus status : {-3, -4, -5, -7, -42, -1110, -6001, -6014, 1}) {
        const std::error_code error = kst::errorOf(status);
        EXPECT_TRUE(error);
        EXPECT_EQ(error.value(), status);
        EXPECT_EQ(&error.category(), &kst::statusCategory());
        EXPECT_EQ(error.message(), KSTStatusText(status));
    }
    EXPECT_STREQ(kst::statusCategory().name(), "KSTLib");
}

TEST(CxxErrors, FailedConnectionsAreTheConditionOfTheirErrno) {
    EXPECT_EQ(kst::errorOf(-1000 - EACCES), std::errc::permission_denied);
    EXPECT_EQ(kst::errorOf(-1000 - ETIMEDOUT), std::errc::timed_out);
    EXPECT_EQ(kst::errorOf(-1000 - ECONNREFUSED), std::errc::connection_refused);
    EXPECT_EQ(kst::errorOf(kKSTErrorBadParameter), std::errc::invalid_argument);
    EXPECT_EQ(kst::errorOf(kKSTErrorOutOfMemory), std::errc::not_enough_memory);
    EXPECT_NE(kst::errorOf(kKSTErrorUnexpected), std::errc::io_error);
    const auto category = [](KSTStatus status) {
        return kst::errorOf(status).default_error_condition().category().name();
    };
    EXPECT_STREQ(category(-1000), "KSTLib");
    EXPECT_STREQ(category(-1001), "generic");
    EXPECT_STREQ(category(-5095), "generic");
    EXPECT_STREQ(category(-5096), "KSTLib");
    EXPECT_STREQ(category(kKSTKernelErrorNoSuchPolicy), "KSTLib");
}

TEST(CxxErrors, ThrowsOnlyForWhoAsksForTheValue) {
    kst::Result<int> some = 7;
    ASSERT_TRUE(some);
    EXPECT_FALSE(some.error());
    EXPECT_EQ(std::move(some).value(), 7);
    kst::Result<int> none = kst::errorOf(-42);
    EXPECT_FALSE(none);
    try {
        static_cast<void>(std::move(none).value());
        FAIL() << "a value that is not there";
    } catch (const std::system_error& thrown) {
        EXPECT_EQ(thrown.code(), kst::errorOf(-42));
    }
    EXPECT_NO_THROW(kst::Result<void>().value());
    EXPECT_THROW(kst::Result<void>(kst::errorOf(-3)).value(), std::system_error);
    const kst::Result<bool> no = false;
    EXPECT_TRUE(no);
    EXPECT_FALSE(*no);
}

TEST(CxxPassphrase, HoldsUpToItsRoomAndMovesOut) {
    const std::string most(kKSTPassphraseMaxLength, 'x');
    for (const std::size_t length : {std::size_t{0}, most.size() - 1, most.size()}) {
        auto held = kst::Passphrase::from(most.data(), length);
        ASSERT_TRUE(held);
        EXPECT_EQ(held->size(), length);
    }
    EXPECT_EQ(kst::Passphrase::from((most + "x").data(), most.size() + 1).error().value(), -3);
    EXPECT_EQ(kst::Passphrase::from(nullptr, 1).error().value(), -3);
    EXPECT_TRUE(kst::Passphrase::from(nullptr, 0));

    kst::Passphrase first = *kst::Passphrase::from("open sesame", 11);
    kst::Passphrase second = std::move(first);
    EXPECT_EQ(textOf(second), "open sesame");
    EXPECT_EQ(first.size(), 0U); // NOLINT: what a move leaves
    EXPECT_EQ(*first.data(), 0); // NOLINT
    first = std::move(second);
    EXPECT_EQ(textOf(first), "open sesame");
    EXPECT_EQ(*second.data(), 0); // NOLINT
    first.wipe();
    EXPECT_EQ(first.size(), 0U);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(first.data()), 11), std::string(11, '\0'));
}

/// Both ends of a pipe with some bytes in it.
struct FilledPipe : private base::NotCopied {
    explicit FilledPipe(const std::string& bytes) {
        EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
        EXPECT_EQ(::write(ends[1], bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
        ::close(ends[1]);
    }
    ~FilledPipe() { ::close(ends[0]); }

    [[nodiscard]] kst::Result<kst::Passphrase> read() const {
        return kst::Passphrase::read("never shown", ends[0]);
    }

    std::array<int, 2> ends{};
};

TEST(CxxPassphrase, ReadsOneLineAndNoFurther) {
    const FilledPipe pipe("open sesame\n\nlast");
    EXPECT_EQ(textOf(*pipe.read()), "open sesame");
    EXPECT_EQ(pipe.read()->size(), 0U);
    EXPECT_EQ(textOf(*pipe.read()), "last");
    EXPECT_EQ(pipe.read().error(), std::errc::no_message);
    EXPECT_EQ(kst::Passphrase::read("", -1).error(), std::errc::bad_file_descriptor);
}

TEST(CxxPassphrase, ALineThatIsTooLongIsReadToItsEnd) {
    const std::string most(kKSTPassphraseMaxLength, 'x');
    const FilledPipe pipe(most + "\n" + most + "y\n" + "next\n");
    EXPECT_EQ(textOf(*pipe.read()), most);
    EXPECT_EQ(pipe.read().error(), kst::errorOf(kKSTErrorBadParameter));
    EXPECT_EQ(textOf(*pipe.read()), "next");
}

/// A terminal, and who sits at it.
class Terminal : private base::NotCopied {
  public:
    Terminal() { EXPECT_EQ(::openpty(&keyboard_, &line_, nullptr, nullptr, nullptr), 0); }
    ~Terminal() {
        ::close(keyboard_);
        ::close(line_);
    }

    [[nodiscard]] int line() const { return line_; }

    [[nodiscard]] bool shows() const {
        termios settings{};
        EXPECT_EQ(::tcgetattr(line_, &settings), 0);
        return (settings.c_lflag & static_cast<tcflag_t>(ECHO)) != 0;
    }

    /// False when it still shows what is typed after 30 seconds.
    [[nodiscard]] bool awaitSilence() const {
        const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(30);
        while (shows() && std::chrono::steady_clock::now() < until) {
            ::sched_yield();
        }
        return !shows();
    }

    void type(const std::string& text) const {
        EXPECT_EQ(::write(keyboard_, text.data(), text.size()), static_cast<ssize_t>(text.size()));
    }

    [[nodiscard]] std::string shown() const {
        std::array<char, 256> text{};
        const ssize_t length = ::read(keyboard_, text.data(), text.size());
        return {text.data(), static_cast<std::size_t>(std::max<ssize_t>(length, 0))};
    }

  private:
    int keyboard_ = -1;
    int line_ = -1;
};

TEST(CxxPassphrase, ATerminalShowsNothingOfIt) {
    const Terminal terminal;
    ASSERT_TRUE(terminal.shows());
    std::string read;
    std::thread reader([&] {
        auto passphrase = kst::Passphrase::read("", terminal.line());
        read = passphrase ? textOf(*passphrase) : passphrase.error().message();
    });
    EXPECT_TRUE(terminal.awaitSilence());
    terminal.type("open sesame\n");
    reader.join();
    EXPECT_EQ(read, "open sesame");
    EXPECT_EQ(terminal.shown(), "\r\n");
    EXPECT_TRUE(terminal.shows());
}

/// How a child ends that reads from the terminal while a signal comes.
int endOfReader(const Terminal& terminal, int signal, void (*handler)(int)) {
    const pid_t child = ::fork();
    if (child == 0) {
        std::signal(signal, handler);
        const auto passphrase = kst::Passphrase::read("", terminal.line());
        ::_exit(passphrase.error() == std::errc::interrupted ? 7 : 1);
    }
    EXPECT_TRUE(terminal.awaitSilence());
    ::kill(child, signal);
    int status = 0;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    return status;
}

TEST(CxxPassphrase, ASignalEndsTheProgramWithTheTerminalAsItWas) {
    const Terminal terminal;
    const int status = endOfReader(terminal, SIGINT, SIG_DFL);
    EXPECT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ(WTERMSIG(status), SIGINT);
    EXPECT_TRUE(terminal.shows());
}

TEST(CxxPassphrase, ASignalThatIsHandledInterruptsIt) {
    const Terminal terminal;
    const int status = endOfReader(terminal, SIGTERM, [](int) {});
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 7);
    EXPECT_TRUE(terminal.shows());
}

class CxxInterface : public support::ChannelFixture {};

TEST_F(CxxInterface, CredentialsAreOwnedAndMoved) {
    const std::int64_t before = gAllocatedBytes;
    {
        auto passphrase = kst::Credential::create(*kst::Passphrase::from("open", 4), 7, 1000);
        ASSERT_TRUE(passphrase);
        EXPECT_EQ(passphrase->type(), 2U);
        const auto number = [&](std::uint32_t id) {
            return passphrase->property(id)->as<std::uint32_t>();
        };
        EXPECT_EQ(number(kKSTCredentialPropertyPurpose), 7U);
        EXPECT_EQ(number(kKSTCredentialPropertyUserId), 1000U);
        const auto bytes = passphrase->property(kKSTCredentialPropertyPassphrase);
        ASSERT_TRUE(bytes);
        EXPECT_EQ(std::string(static_cast<const char*>(bytes->data), bytes->length), "open");
        EXPECT_EQ(bytes->as<std::uint64_t>(), std::nullopt);
        EXPECT_EQ(passphrase->property(kKSTCredentialProperty300).error().value(), -3);
        EXPECT_EQ(passphrase->set(kKSTCredentialProperty300, 1).error().value(), -3);

        kst::Credential moved = *std::move(passphrase);
        EXPECT_EQ(moved.type(), 2U);
        moved = *kst::Credential::create(1);
        EXPECT_EQ(moved.type(), 1U);
        kst::Credential& same = moved;
        moved = std::move(same);
        EXPECT_EQ(moved.type(), 1U);
    }
    EXPECT_EQ(gAllocatedBytes, before);
    EXPECT_EQ(kst::Credential::create(0).error().value(), -3);
    EXPECT_EQ(kst::Credential::create(13).error().value(), -3);
    auto own = kst::Credential::create(kst::Passphrase(), 0);
    ASSERT_TRUE(own);
    EXPECT_EQ(own->property(kKSTCredentialPropertyUserId)->as<std::uint32_t>(), ::getuid());
}

TEST_F(CxxInterface, RequirementsAreCopiedOut) {
    support::Bytes biometry = leafBytes(3, 68);
    support::Bytes displayed = leafBytes(13, 32);
    auto list = compositeInMemory(5, {asRequirement(biometry), nullptr, asRequirement(displayed)});
    const auto copied = kst::Requirement::of(asRequirement(list));
    ASSERT_TRUE(copied);
    std::fill(list.begin(), list.end(), 0xff);
    std::fill(biometry.begin(), biometry.end(), 0xff);

    const kst::Requirement tree = *copied;
    EXPECT_EQ(tree.type(), 5U);
    EXPECT_EQ(tree.state(), 0x04040404U);
    EXPECT_EQ(tree.priority(), 0x08080808U);
    ASSERT_EQ(tree.children().size(), 2U);
    const kst::Requirement& leaf = tree.children()[0];
    EXPECT_EQ(leaf.number(kKSTRequirementPropertyAgeLimit), 0x03020100U);
    const auto lengthOf = [](const kst::Requirement& node, std::uint32_t id) {
        const auto bytes = node.property(id);
        return bytes ? bytes->length : 0;
    };
    EXPECT_EQ(lengthOf(leaf, 300), 16U);
    EXPECT_EQ(lengthOf(leaf, 301), 32U);
    EXPECT_EQ(lengthOf(leaf, 302), 16U);
    EXPECT_EQ(*static_cast<const std::uint8_t*>(leaf.property(301)->data), 36);
    EXPECT_EQ(lengthOf(tree.children()[1], 400), 32U);
    EXPECT_EQ(leaf.purpose(), std::nullopt);
    EXPECT_EQ(leaf.number(300), std::nullopt);
    EXPECT_EQ(kst::Requirement::of(nullptr).error().value(), -3);
    EXPECT_TRUE(logged().empty()) << "nothing is asked for that is not there";
}

TEST_F(CxxInterface, RequirementsAreComparedAndWalked) {
    support::Bytes one = leafBytes(2, 4);
    support::Bytes other = leafBytes(2, 4);
    auto both = compositeInMemory(4, {asRequirement(one), asRequirement(other)});
    const kst::Requirement tree = *kst::Requirement::of(asRequirement(both));
    EXPECT_EQ(tree, *kst::Requirement::of(asRequirement(both)));
    EXPECT_EQ(tree.children()[0], tree.children()[1]);
    other[16] = 9;
    EXPECT_NE(tree, *kst::Requirement::of(asRequirement(both)));

    std::string seen;
    tree.walk([&](const kst::Requirement& node, std::size_t depth) {
        seen += std::to_string(depth) + ":" + std::to_string(node.type()) + " ";
    });
    EXPECT_EQ(seen, "0:4 1:2 1:2 ");
}

TEST_F(CxxInterface, NodesHaveWords) {
    const auto wordsOf = [](std::uint32_t type, std::uint32_t state, std::uint32_t data) {
        support::Bytes node = leafBytes(type, type == 7 ? 8 : 4);
        support::putU32(node, 4, state);
        support::putU32(node, 16, data);
        if (type == 7) {
            support::putU32(node, 20, 0);
        }
        return kst::Requirement::of(asRequirement(node))->words();
    };
    EXPECT_EQ(wordsOf(2, 1, 0), "a passphrase for any purpose");
    EXPECT_EQ(wordsOf(2, 1, 7), "a passphrase for purpose 7");
    EXPECT_EQ(wordsOf(2, 2, 7), "a passphrase for purpose 7, too old");
    EXPECT_EQ(wordsOf(1, 1, 0xffffffff), "a passcode");
    EXPECT_EQ(wordsOf(1, 2, 300), "a passcode of the last 300 seconds, too old");
    EXPECT_EQ(wordsOf(7, 1, 2), "2 of");
    EXPECT_EQ(wordsOf(4, 1, 0), "all of");
    EXPECT_EQ(wordsOf(16, 3, 0), "what no credential gives, state 3");
}

TEST_F(CxxInterface, WhatWasMovedAwayIsRefused) {
    kst::Credential credential = *kst::Credential::create(1);
    const kst::Credential taken = std::move(credential);
    EXPECT_EQ(credential.get(), nullptr);                        // NOLINT: what a move leaves
    EXPECT_EQ(kst::addGlobally(credential).error().value(), -3); // NOLINT
    EXPECT_EQ(kst::ExternalForm::from("short", 5).error().value(), -3);
    EXPECT_EQ(kst::ExternalForm::from(nullptr, 16).error().value(), -3);
}

} // namespace
