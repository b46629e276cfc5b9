#include "tests/neighbours/Stage.h"

#include "base/ByteReader.h"
#include "base/Concat.h"
#include "base/Saturate.h"
#include "base/UnixAddress.h"
#include "platform/Date.h"
#include "platform/ManagedSettings.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/Paths.h"
#include "wire/EventDatagram.h"
#include "wire/RestrictedMode.h"

#include <array>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <sqlite3.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

using namespace wire::rm;
using Clock = std::chrono::steady_clock;

/// How long anything may take that must happen. The library waits for a silent kernel side for five
/// seconds, a few times in a row at most.
constexpr std::chrono::seconds kPatience{60};
constexpr std::size_t kTurnsBetweenLooks = 64;

std::optional<Bytes> contentOf(const std::string& path) {
    const base::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    Bytes content(256);
    const ssize_t length = file.isOpen() ? ::read(file.get(), content.data(), content.size()) : -1;
    if (length < 0) {
        return std::nullopt;
    }
    content.resize(static_cast<std::size_t>(length));
    return content;
}

std::uint64_t readU64(std::span<const std::uint8_t> bytes) {
    std::uint64_t value = 0;
    static_cast<void>(base::ByteReader(bytes).readU64(value));
    return value;
}

/// As docs/linux-host.md has it.
std::string alarmFileContent(std::uint64_t seconds) {
    if (seconds == 0) {
        return "none" + std::string(16, ' ') + "\n";
    }
    const auto date =
        base::saturatingMultiply(base::saturate<std::int64_t>(static_cast<double>(seconds)),
                                 platform::kNanosecondsPerSecond);
    std::array<char, 32> line{};
    std::snprintf(line.data(), line.size(), "%020" PRId64 "\n", date);
    return line.data();
}

} // namespace

Stage::Stage(std::string program, std::vector<std::string> options)
    : program_(std::move(program)), options_(std::move(options)) {
    for (const char* const directory : {"run/kstd", "run/keystrand", "etc/kstd", "var/root"}) {
        std::filesystem::create_directories(root_.path() / directory);
    }
    const platform::Paths paths(root_.path().string());
    events_ = platform::makeEventSocket(paths.eventSocket());
    sender_ = base::FileDescriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const auto address = base::UnixAddress::of(paths.eventSocket());
    require(events_.isOpen() && address.has_value() &&
                ::connect(sender_.get(), address->get(), address->size()) == 0,
            "no event socket");
    kernel = std::make_unique<KernelSide>(
        paths.kernelSocket(),
        [this](const std::string& property, const std::optional<Bytes>& record, bool waits) {
            checkAcknowledged(property, record, waits);
        });
}

Stage::~Stage() {
    ::sqlite3_close(database_);
}

void Stage::launch() {
    std::vector<std::string> words{program_, "--root", root_.path().string()};
    words.insert(words.end(), options_.begin(), options_.end());
    daemon_ = std::make_unique<Daemon>(words, events_.get(), "Entering the main runloop.");
    await("a daemon in its run loop", [this] { return daemon_->isReady(); });
}

void Stage::end() {
    daemon_->ask();
    const auto deadline = Clock::now() + kPatience;
    while (daemon_->runs()) {
        serveOnce();
        daemon_->listen();
        require(Clock::now() < deadline, "the daemon does not end");
    }
    require(daemon_->ending() == "status 0", "the daemon ended with " + daemon_->ending());
    formerLines_ += daemon_->lines();
    daemon_.reset();
}

std::string Stage::report() const {
    std::string text;
    for (const std::string& line : daemon_ ? daemon_->newest() : std::deque<std::string>()) {
        text += "    " + line + "\n";
    }
    return text;
}

void Stage::send(std::span<const std::uint8_t> datagram, bool withDescriptors) {
    iovec data{const_cast<std::uint8_t*>(datagram.data()), datagram.size()};
    alignas(cmsghdr) std::uint8_t control[CMSG_SPACE(sizeof(int))]{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    if (withDescriptors) {
        message.msg_control = control;
        message.msg_controllen = sizeof control;
        cmsghdr* const part = CMSG_FIRSTHDR(&message);
        part->cmsg_level = SOL_SOCKET;
        part->cmsg_type = SCM_RIGHTS;
        part->cmsg_len = CMSG_LEN(sizeof(int));
        const int descriptor = STDIN_FILENO;
        std::memcpy(CMSG_DATA(part), &descriptor, sizeof descriptor);
    }
    await("room in the event socket's queue",
          [&] { return ::sendmsg(sender_.get(), &message, MSG_NOSIGNAL) >= 0; });
}

void Stage::publish(const std::string& property, Bytes record) {
    kernel->properties[property] = std::move(record);
    send(wire::encodeEvent(wire::kNotifydMatchingStream, kNotificationNamePrefix + property)
             .value());
}

bool Stage::serveOnce() {
    constexpr int kMilliseconds = 2;
    watched_.clear();
    kernel->addTo(watched_);
    if (https) {
        https->addTo(watched_);
    }
    const int ready = ::poll(watched_.data(), watched_.size(), kMilliseconds);
    if (ready > 0) {
        kernel->serve(watched_);
        if (https) {
            https->serve(watched_);
        }
    }
    return ready > 0;
}

void Stage::turn() {
    // What the daemon says is taken now and then: to wait for it would cost a turn for each line.
    if (!serveOnce() || ++turns_ % kTurnsBetweenLooks == 0) {
        daemon_->listen();
        require(daemon_->runs(), "the daemon ended with " + daemon_->ending());
    }
}

void Stage::await(const std::string& what, const std::function<bool()>& isSo) {
    std::optional<Clock::time_point> deadline;
    while (!isSo()) {
        turn();
        const auto now = Clock::now();
        deadline = deadline.value_or(now + kPatience);
        require(now < *deadline, "there is never " + what);
    }
}

void Stage::awaitEmptyQueue() {
    await("an empty event queue", [this] {
        int waiting = 0;
        return ::ioctl(events_.get(), FIONREAD, &waiting) == 0 && waiting == 0;
    });
}

void Stage::exchangeProperly(Random& random) {
    kernel->beHostile(nullptr);
    // An answer too many from before costs the daemon one exchange on each of its connections.
    publish(kSaveAnalyticsProperty, wellFormedRecord(random, kKSTRMNotificationSaveAnalytics));
    send(wire::encodeEvent(wire::kNotifydMatchingStream, platform::kSettingsChangedEvent).value());
    for (const NotificationKind& kind : kNotificationKinds) {
        const Bytes record = wellFormedRecord(random, kind.type);
        publish(kind.property, record);
        await(base::concat("an acknowledgement of ", kind.property),
              [&] { return confirmed_[kind.property] == record; });
    }
    // The line that tells of the last one may still be on its way.
    daemon_->listen();
}

void Stage::checkAcknowledged(const std::string& property, const std::optional<Bytes>& record,
                              bool waits) {
    require(record && record->size() == kNotificationSize,
            "acknowledged " + property + ", of which there was no record");
    std::uint32_t type = 0;
    static_cast<void>(base::ByteReader(*record).readU32(type));
    require(findNotificationKind(type) != nullptr,
            base::concat("acknowledged a record of type ", type));
    const bool areFigures = type == kKSTRMNotificationAnalyticsCollected ||
                            type == kKSTRMNotificationTimerRestartedAnalyticsCollected;
    figures_ += areFigures ? 1 : 0;
    ++acknowledged_;
    confirmed_[property] = *record;
    // A daemon that does not wait may have handled the next record by now.
    if (waits) {
        checkFiles(type, *record);
    }
}

void Stage::checkFiles(std::uint32_t type, std::span<const std::uint8_t> record) const {
    if (type == kKSTRMNotificationTimerRestarted) {
        checkFile("var/root/.usbrestrictedmode_v2",
                  record.subspan(kStateBlobOffset, kStateBlobSize));
        checkAlarm(readU64(record.subspan(kAlarmTimestampOffset, 8)));
    } else if (type == kKSTRMNotificationSaveAnalytics) {
        checkFile("var/root/.usbrestrictedmode_analytics",
                  record.subspan(kAnalyticsBlobOffset, kAnalyticsBlobSize));
    }
}

void Stage::checkFile(const std::string& path, std::span<const std::uint8_t> expected) const {
    const auto content = contentOf(real(path));
    require(content &&
                std::equal(content->begin(), content->end(), expected.begin(), expected.end()),
            "acknowledged what is not in " + path);
}

void Stage::checkAlarm(std::uint64_t seconds) const {
    const auto content =
        contentOf(real("var/lib/kstd/alarms/com.zerva.alarm/com.zerva.kstd.alarm"));
    // None was ever registered, so none had to be cancelled.
    if (!content && seconds == 0) {
        return;
    }
    const std::string expected = alarmFileContent(seconds);
    require(
        content && std::string(content->begin(), content->end()) == expected,
        "acknowledged an alarm that is not on disk: " + expected +
            (content ? "there is: " + std::string(content->begin(), content->end()) : "no file"));
}

sqlite3* Stage::database() {
    if (database_ == nullptr) {
        const std::string path = real("var/root/.usbrestrictedmode_analytics_v2.db");
        require(::sqlite3_open_v2(path.c_str(), &database_, SQLITE_OPEN_READWRITE, nullptr) ==
                    SQLITE_OK,
                "no database");
        ::sqlite3_busy_timeout(database_, 30'000);
    }
    return database_;
}

std::uint64_t Stage::query(const std::string& sql) {
    std::uint64_t value = 0;
    const auto take = [](void* taken, int, char** columns, char**) {
        *static_cast<std::uint64_t*>(taken) = std::strtoull(columns[0], nullptr, 10);
        return 0;
    };
    require(::sqlite3_exec(database(), sql.c_str(), take, &value, nullptr) == SQLITE_OK,
            base::concat(sql, ": ", ::sqlite3_errmsg(database_)));
    return value;
}

std::uint64_t Stage::storedEvents() {
    return query("select count(*) from all_events");
}

void Stage::makeUploadDue() {
    query("update Properties set value = '2001-01-01T00:00:00Z' where key = 'upload_date'");
}

std::uint64_t Stage::bytesOnDisk() const {
    std::uint64_t bytes = 0;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root_.path() / "var")) {
        bytes += entry.is_regular_file() ? entry.file_size() : 0;
    }
    return bytes;
}

} // namespace neighbours
