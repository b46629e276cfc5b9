// A timer notification from its event to its acknowledgement, through the daemon's own code on the
// Linux host, against a bare write, sync and round trip.

#include "KSTLib/Platform.h"
#include "base/ByteWriter.h"
#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "bench/support/BareFile.h"
#include "bench/support/Benchmark.h"
#include "bench/support/Comparison.h"
#include "bench/support/Peer.h"
#include "bench/support/PrivateRoot.h"
#include "bench/support/Quiet.h"
#include "bench/support/SystemError.h"
#include "kstd/Daemon.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/MainRunLoop.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "tests/support/HostWith.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <array>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace {

constexpr int kDefaultRounds = 1000;
constexpr double kTarget = 1.45;
constexpr double kSameCallsTarget = 1.15;

/// In the year 2100: armed, and never due.
constexpr std::uint64_t kFarAlarm = 4102444800;

/// What the records of a series ask for.
struct Alarm {
    const char* name;
    std::uint64_t timestamp;
    bool changes;
};

constexpr Alarm kAlarms[] = {
    {"none", 0, false}, {"unchanged", kFarAlarm, false}, {"changed", kFarAlarm, true}};

bench::PeerScript scriptFor(const Alarm& alarm) {
    using wire::KernelOperation;
    bench::Bytes record(wire::rm::kNotificationSize);
    base::ByteWriter writer(record);
    if (!writer.writeU32(wire::rm::kKSTRMNotificationTimerRestarted) ||
        !writer.writeU64(alarm.timestamp)) {
        throw std::logic_error("a record has no room for its fields");
    }
    bench::PeerScript script = bench::basicScript();
    script.replies[KernelOperation::copyProperty] =
        bench::preparedReply(KernelOperation::copyProperty, 1, record);
    script.replies[KernelOperation::structCall] =
        bench::preparedReply(KernelOperation::structCall, 0, {});
    if (alarm.changes) {
        script.growingNumber = wire::kKernelReplyHeaderSize + wire::rm::kAlarmTimestampOffset;
    }
    return script;
}

/// Stands behind the daemon's service and so sees an event when that has handled it.
class Handled final : public kstd::KSTService {
  public:
    explicit Handled(const platform::Host& host) : KSTService(host) {}

    void handleWispEventWithName(std::string_view /*eventName*/) override { ++count_; }
    [[nodiscard]] std::string description() const override { return "<Handled>"; }

    [[nodiscard]] std::uint64_t count() const { return count_; }

  private:
    std::uint64_t count_ = 0;
};

/// The daemon's run loop, which runs a measurement in place of its turns and then has no source
/// left; the measurement turns the real loop.
class MeasuringLoop final : public platform::MainRunLoop {
  public:
    explicit MeasuringLoop(std::function<void()> measurement)
        : measurement_(std::move(measurement)) {}

    [[nodiscard]] bool runOnce(platform::Date /*deadline*/) override {
        measurement_();
        return false;
    }

  private:
    std::function<void()> measurement_;
};

/// Sends the event of a timer notification, as the kernel side does.
class EventSender {
  public:
    explicit EventSender(const std::string& path)
        : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)),
          datagram_(wire::encodeEvent(wire::kNotifydMatchingStream,
                                      base::concat(wire::rm::kNotificationNamePrefix,
                                                   wire::rm::kTimerRestartedProperty))
                        .value()) {
        const auto address = base::UnixAddress::of(path);
        if (!address || ::connect(socket_.get(), address->get(), address->size()) != 0) {
            throw bench::systemError("cannot connect to " + path);
        }
    }

    void send() {
        if (::send(socket_.get(), datagram_.data(), datagram_.size(), MSG_NOSIGNAL) < 0) {
            throw bench::systemError("cannot send the event");
        }
    }

  private:
    base::FileDescriptor socket_;
    bench::Bytes datagram_;
};

/// What the daemon asks the system for between the event and the acknowledgement, by a program that
/// knows what to expect: it waits for the event, asks twice, saves, acknowledges, and writes as
/// many lines.
class SameCalls {
  public:
    SameCalls(const platform::Paths& paths, const bench::Bytes& request)
        : events_(platform::makeEventSocket(paths.under("/run/kstd/bare-events.sock"))),
          sender_(paths.under("/run/kstd/bare-events.sock")),
          registry_(paths.kernelSocket(), request),
          channel_(paths.kernelSocket(), request),
          path_(paths.under("/var/root/bare-third-state")),
          state_(path_, wire::rm::kStateBlobSize, bench::BareFile::Sync::dataAndTimes),
          loop_(::epoll_create1(EPOLL_CLOEXEC)) {
        epoll_event watched{EPOLLIN, {}};
        if (::epoll_ctl(loop_.get(), EPOLL_CTL_ADD, events_.get(), &watched) != 0) {
            throw bench::systemError("cannot watch the event socket");
        }
    }

    void run() {
        sender_.send();
        await(-1);
        receive();
        await(0);
        lines(2);
        registry_.roundTrip();
        registry_.roundTrip();
        lines(4);
        state_.openAndSave();
        lines(2);
        channel_.roundTrip();
        lines(1);
    }

    [[nodiscard]] std::uint64_t roundTrips() const {
        return registry_.roundTrips() + channel_.roundTrips();
    }

  private:
    void await(int milliseconds) {
        epoll_event ready{};
        if (::epoll_wait(loop_.get(), &ready, 1, milliseconds) < 0) {
            throw bench::systemError("cannot wait for the event");
        }
    }

    void receive() {
        std::array<char, 4096> datagram;
        std::array<char, 256> credentials;
        iovec part{datagram.data(), datagram.size()};
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = credentials.data();
        message.msg_controllen = credentials.size();
        if (::recvmsg(events_.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC) <= 0) {
            throw bench::systemError("cannot receive the event");
        }
    }

    /// Of the usual length.
    static void lines(int count) {
        static const std::string line(100, 'l');
        for (int i = 0; i < count; ++i) {
            static_cast<void>(!::write(STDERR_FILENO, line.data(), line.size()));
        }
    }

    base::FileDescriptor events_;
    EventSender sender_;
    bench::BareExchange registry_;
    bench::BareExchange channel_;
    std::string path_;
    bench::BareFile state_;
    base::FileDescriptor loop_;
};

/// One series: a daemon with a peer of its own, under a root of its own.
class Series {
  public:
    Series(const std::filesystem::path& root, const Alarm& alarm, platform::SystemLog* otherLog)
        : paths_(bench::makePrivateRoot(root)),
          peer_(paths_.kernelSocket(), scriptFor(alarm)),
          linuxHost_(
              {.paths = paths_, .eventSocket = platform::makeEventSocket(paths_.eventSocket())}),
          loop_([this] { measure(); }),
          host_(support::hostWith(linuxHost_.interfaces(), {.log = otherLog, .runLoop = &loop_})),
          handled_(std::make_shared<Handled>(host_)),
          sender_(paths_.eventSocket()) {}

    /// The times of a bare save and acknowledgement, of the same with a second save, of all that
    /// the daemon asks the system for, and of the daemon's.
    [[nodiscard]] bench::Measured run(int rounds) {
        rounds_ = rounds;
        kst::installPlatform({host_.log, host_.registry, host_.channel});
        const int status =
            kstd::Daemon(host_, {kstd::DeviceRestrictedModeService::make(host_), handled_}).run();
        kst::removePlatform();
        if (status != 0) {
            throw std::runtime_error("the daemon failed");
        }
        return std::move(measured_);
    }

  private:
    void notify() {
        const std::uint64_t before = handled_->count();
        sender_.send();
        while (handled_->count() == before) {
            if (!linuxHost_.interfaces().runLoop.runOnce(platform::kDistantFuture)) {
                throw std::runtime_error("the run loop ended");
            }
        }
    }

    [[nodiscard]] bench::BareFile bareState(const char* path) const {
        return {paths_.under(path), wire::rm::kStateBlobSize, bench::BareFile::Sync::dataAndTimes};
    }

    void measure() {
        notify();
        bench::BareExchange bare(paths_.kernelSocket(), peer_.lastRequest());
        // Each has files of its own: one that is written twice in a round is synced faster the
        // second time.
        bench::BareFile state = bareState("/var/root/bare-state");
        bench::BareFile secondState = bareState("/var/root/bare-second-state");
        bench::BareFile alarm(paths_.under("/var/root/bare-alarm"), kAlarmFileSize,
                              bench::BareFile::Sync::data);
        SameCalls same(paths_, peer_.lastRequest());
        const std::uint64_t before = peer_.structCalls();
        const std::uint64_t handledBefore = handled_->count();
        measured_ = bench::interleave(rounds_, 1,
                                      {[&] {
                                           state.save();
                                           bare.roundTrip();
                                       },
                                       [&] {
                                           secondState.save();
                                           alarm.save();
                                           bare.roundTrip();
                                       },
                                       [&] { same.run(); },
                                       [this] {
                                           notify();
                                       }});
        const std::uint64_t handled = handled_->count() - handledBefore;
        if (peer_.structCalls() - before != handled + bare.roundTrips() + same.roundTrips()) {
            throw std::runtime_error("not every notification was acknowledged");
        }
    }

    /// What the host keeps of an alarm on disk.
    static constexpr std::size_t kAlarmFileSize = 21;

    platform::Paths paths_;
    bench::Peer peer_;
    platform::LinuxHost linuxHost_;
    MeasuringLoop loop_;
    platform::Host host_;
    std::shared_ptr<Handled> handled_;
    EventSender sender_;
    int rounds_ = 0;
    bench::Measured measured_;
};

void measureAll(const bench::Options& options, const std::filesystem::path& directory) {
    const bench::QuietStandardError quiet;
    bench::printHead(base::concat("Event to acknowledgement against a bare save and round trip, ",
                                  options.rounds, " rounds, ",
                                  options.pinned ? "one CPU" : "any CPU"));
    bench::NullLog noLog;
    int number = 0;
    const auto series = [&](const char* prefix, const Alarm& alarm, platform::SystemLog* otherLog) {
        const auto root = directory / base::concat(++number);
        const auto measured = Series(root, alarm, otherLog).run(options.rounds);
        const std::string name = base::concat(prefix, "alarm ", alarm.name);
        bench::printRow(name, bench::compare(measured, 0, 3), kTarget);
        if (alarm.timestamp != 0) {
            bench::printRow(base::concat(name, ", floor with two saves"),
                            bench::compare(measured, 1, 3), kTarget);
        } else if (otherLog == nullptr) {
            bench::printRow(base::concat(name, ", floor with the same calls"),
                            bench::compare(measured, 2, 3), kSameCallsTarget);
        }
    };
    for (const Alarm& alarm : kAlarms) {
        series("", alarm, nullptr);
    }
    for (const Alarm& alarm : kAlarms) {
        series("no log, ", alarm, &noLog);
    }
}

} // namespace

int main(int argc, char** argv) {
    return bench::runBenchmark(
        argc, argv,
        "The cost of a notification over that of its durable write and its acknowledgement.",
        {.rounds = kDefaultRounds}, measureAll);
}
