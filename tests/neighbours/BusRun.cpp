// The alarm's helper with a hostile bus, and words about the alarms from anybody who may say them.

#include "base/Concat.h"
#include "base/FileDescriptor.h"
#include "base/UnixAddress.h"
#include "kstd-notify/AlarmHelper.h"
#include "kstd-notify/SystemdAlarmTimer.h"
#include "platform/linux/Paths.h"
#include "platform/linux/alarms/AlarmStore.h"
#include "tests/neighbours/Batches.h"
#include "tests/neighbours/Bus.h"
#include "tests/support/TemporaryDirectory.h"
#include "wire/AlarmAnswer.h"
#include "wire/EventDatagram.h"

#include <array>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

class NoLog final : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view /*text*/,
               const platform::LogFields& /*fields*/) override {}
};

class FixedClock final : public platform::Clock {
  public:
    [[nodiscard]] platform::Date now() override { return {1'700'000'000'000'000'000}; }
};

struct Pair {
    Pair(int type) {
        int both[2];
        require(::socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, both) == 0, "no pair of sockets");
        ours = base::FileDescriptor(both[0]);
        theirs = base::FileDescriptor(both[1]);
    }

    base::FileDescriptor ours;
    base::FileDescriptor theirs;
};

/// Says that the alarms have changed, with descriptors.
void sendWord(int socket, std::span<const int> descriptors, const Bytes& content) {
    iovec data{const_cast<std::uint8_t*>(content.data()), content.size()};
    alignas(cmsghdr) std::uint8_t control[CMSG_SPACE(4 * sizeof(int))]{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    if (!descriptors.empty()) {
        message.msg_control = control;
        message.msg_controllen = CMSG_SPACE(descriptors.size_bytes());
        cmsghdr* const part = CMSG_FIRSTHDR(&message);
        part->cmsg_level = SOL_SOCKET;
        part->cmsg_type = SCM_RIGHTS;
        part->cmsg_len = CMSG_LEN(descriptors.size_bytes());
        std::memcpy(CMSG_DATA(part), descriptors.data(), descriptors.size_bytes());
    }
    require(::sendmsg(socket, &message, MSG_NOSIGNAL | MSG_DONTWAIT) >= 0, "no room for a word");
}

/// The helper's surroundings: alarms on disk, the socket by which it is told of them, the bus.
class HelperStage {
  public:
    HelperStage(Random ideas, std::size_t silences)
        : paths_(root_.path().string()), ideas_(ideas.next()) {
        std::filesystem::create_directories(root_.path() / "run/dbus");
        bus.emplace(paths_.systemBus(), Random(ideas.next()), silences);
    }

    /// One run of the helper, as `kstd-notify arm` makes it. What it answers is held against what
    /// the bus has told it.
    void arm() {
        platform::AlarmStore store(paths_.alarmDirectory(), {wire::kAlarmName}, log_);
        putAlarm(store);
        Pair words(SOCK_DGRAM);
        Pair answers(SOCK_DGRAM);
        // As its unit has it.
        const int on = 1;
        ::setsockopt(words.theirs.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
        const int theirs[] = {answers.theirs.get()};
        sendWord(words.ours.get(), theirs, {1});
        sayAnything(words.ours.get());
        notify::SystemdAlarmTimer unit(paths_.systemBus());
        notify::AlarmTimer timer(unit, clock_,
                                 ideas_.oneIn(2) ? notify::AlarmTimer::Machine::canBeWoken
                                                 : notify::AlarmTimer::Machine::cannotBeWoken);
        std::ostringstream errors;
        notify::AlarmHelper helper(std::move(words.theirs), store, unit, timer, clock_, errors);
        // Its own answer may have come back to it as the last word, when it may end as it likes.
        static_cast<void>(helper.run());
        checkLines(errors.str());
        checkAnswer(answers.ours.get());
    }

    std::optional<Bus> bus;

  private:
    void putAlarm(platform::AlarmStore& store) {
        date_ = std::nullopt;
        if (ideas_.oneIn(5)) {
            store.clear(wire::kAlarmStream, wire::kAlarmName);
            return;
        }
        const auto seconds = static_cast<std::int64_t>(1'700'000'001 + ideas_.below(1'000'000'000));
        date_ = seconds * 1'000'000'000 + static_cast<std::int64_t>(ideas_.below(1'000'000)) * 1000;
        require(store.save(wire::kAlarmStream, wire::kAlarmName, platform::Date{*date_}),
                "no alarm on disk");
    }

    void sayAnything(int socket) {
        for (std::size_t count = ideas_.below(4); count > 0; --count) {
            const std::array<int, 4> descriptors = {STDIN_FILENO, socket, STDOUT_FILENO, socket};
            sendWord(socket, std::span(descriptors).first(ideas_.below(5)),
                     ideas_.bytes(ideas_.length(200)));
        }
    }

    static void checkLines(const std::string& errors) {
        require(errors.size() < 64 * 1024, "too much said");
        for (const char character : errors) {
            const auto byte = static_cast<unsigned char>(character);
            require(character == '\n' || (byte >= 0x20 && byte != 0x7f),
                    "a line with a control character in it");
        }
    }

    void checkAnswer(int socket) {
        std::array<std::uint8_t, wire::kAlarmAnswerMaxSize + 1> buffer{};
        const ssize_t length = ::recv(socket, buffer.data(), buffer.size(), MSG_DONTWAIT);
        require(length > 0, "no answer");
        const auto answer =
            wire::decodeAlarmAnswer(std::span(buffer).first(static_cast<std::size_t>(length)));
        require(answer.has_value(), "a malformed answer");
        using Timer = wire::AlarmAnswer::Timer;
        if (answer->timer == Timer::waits) {
            // Only because the bus has said so.
            require(date_ && answer->date == *date_, "a timer for another date");
            require(bus->toldTime() == static_cast<std::uint64_t>(*date_ / 1000),
                    "a timer of which the bus has not told");
        }
        require(answer->timer != Timer::none || !date_, "no timer, though there is an alarm");
        if (bus->behaves()) {
            require(answer->timer == (date_ ? Timer::waits : Timer::none),
                    "no timer from a bus that behaves: " + answer->reason);
        }
    }

    support::TemporaryDirectory root_;
    platform::Paths paths_;
    Random ideas_;
    NoLog log_;
    FixedClock clock_;
    std::optional<std::int64_t> date_;
};

/// A batch, on a bus of its own; how many exchanges it was.
std::uint64_t armOften(Random ideas, std::uint64_t times, std::size_t silences) {
    HelperStage stage(ideas, silences);
    stage.bus->behave(false);
    for (std::uint64_t i = 0; i < times; ++i) {
        stage.arm();
    }
    stage.bus->behave(true);
    stage.arm();
    return stage.bus->exchanges();
}

} // namespace

void runBus(const RunOptions& options) {
    constexpr std::uint64_t kBatch = 200;
    Batches batches(options, "bus");
    // What the heap of each thread keeps at hand counts as allocated, and each bus has a thread.
    Growth growth(mostGrowth(1'000));
    std::uint64_t exchanges = 0;
    std::uint64_t runs = 0;
    batches.guard([&] {
        do {
            exchanges += armOften(batches.ideas(), kBatch, batches.silences());
            runs += kBatch + 1;
            growth.look(Footprint::ofThis());
        } while (batches.end(exchanges));
    });
    batches.print(base::concat(runs, " runs of the helper, ", growth.text()));
}

} // namespace neighbours
