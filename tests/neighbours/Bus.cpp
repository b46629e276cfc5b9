#include "tests/neighbours/Bus.h"

#include "base/ByteReader.h"
#include "base/Concat.h"
#include "base/UnixAddress.h"

#include <algorithm>
#include <ctime>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

enum Field : std::uint8_t {
    kPath = 1,
    kInterface = 2,
    kMember = 3,
    kErrorName = 4,
    kReplySerial = 5,
    kDestination = 6,
    kSender = 7,
    kSignature = 8,
};

constexpr std::size_t kFixedSize = 16;
constexpr std::size_t kLargestMessage = 1 << 20;
constexpr char kInit[] = ":1.1";
constexpr char kClient[] = ":1.7";
constexpr char kManagerPath[] = "/org/freedesktop/systemd1";
constexpr char kManager[] = "org.freedesktop.systemd1.Manager";
constexpr char kJobs[] = "/org/freedesktop/systemd1/job/";
constexpr char kUnit[] = "kstd-alarm.timer";

void align(Bytes& bytes, std::size_t size) {
    bytes.resize((bytes.size() + size - 1) / size * size);
}

void appendString(Bytes& bytes, std::string_view text) {
    align(bytes, 4);
    append(bytes, static_cast<std::uint32_t>(text.size()));
    append(bytes, text);
    bytes.push_back(0);
}

void appendSignature(Bytes& bytes, std::string_view text) {
    bytes.push_back(static_cast<std::uint8_t>(text.size()));
    append(bytes, text);
    bytes.push_back(0);
}

void appendField(Bytes& bytes, Field field, std::string_view type, std::string_view text) {
    if (text.empty()) {
        return;
    }
    align(bytes, 8);
    bytes.push_back(field);
    appendSignature(bytes, type);
    if (type == "g") {
        appendSignature(bytes, text);
    } else {
        appendString(bytes, text);
    }
}

std::uint32_t readU32(std::span<const std::uint8_t> bytes, std::size_t offset) {
    std::uint32_t value = 0;
    static_cast<void>(base::ByteReader(bytes.subspan(offset)).readU32(value));
    return value;
}

/// The text of a header's field, as the client's library writes it.
std::string fieldText(std::span<const std::uint8_t> message, Field wanted, std::size_t end) {
    std::size_t at = kFixedSize;
    while (at + 8 <= end) {
        at = (at + 7) / 8 * 8;
        const std::uint8_t field = message[at];
        const bool isSignature = message[at + 2] == 'g';
        const bool isNumber = message[at + 2] == 'u';
        at += 4;
        const std::size_t length = isNumber ? 0 : isSignature ? message[at] : readU32(message, at);
        const std::size_t start = at + (isSignature ? 1 : 4);
        if (field == wanted && !isNumber) {
            return {reinterpret_cast<const char*>(message.data() + start), length};
        }
        at = start + (isNumber ? 0 : length + 1);
    }
    return "";
}

/// The text of the first property of a unit that is to be made, and so of its calendar, is found by
/// its looks: "2023-11-14 22:13:20.999999 UTC".
std::uint64_t calendarTime(std::span<const std::uint8_t> body) {
    const std::string_view text(reinterpret_cast<const char*>(body.data()), body.size());
    const auto end = text.find(" UTC");
    constexpr std::size_t kLength = 26;
    if (end == std::string_view::npos || end < kLength) {
        return ~std::uint64_t{0};
    }
    const std::string words(text.substr(end - kLength, kLength));
    tm parts{};
    const char* const rest = ::strptime(words.c_str(), "%Y-%m-%d %H:%M:%S", &parts);
    return rest == nullptr ? ~std::uint64_t{0}
                           : static_cast<std::uint64_t>(::timegm(&parts)) * 1'000'000 +
                                 std::strtoull(rest + 1, nullptr, 10);
}

} // namespace

Bytes BusMessage::encode() const {
    Bytes fields;
    // Aligned as they are in the message, whose fixed part is a multiple of 8.
    appendField(fields, kPath, "o", path);
    appendField(fields, kInterface, "s", interface);
    appendField(fields, kMember, "s", member);
    appendField(fields, kErrorName, "s", errorName);
    if (replyTo != 0) {
        align(fields, 8);
        fields.push_back(kReplySerial);
        appendSignature(fields, "u");
        append(fields, replyTo);
    }
    appendField(fields, kDestination, "s", destination);
    appendField(fields, kSender, "s", sender);
    appendField(fields, kSignature, "g", signature);
    Bytes message{'l', static_cast<std::uint8_t>(kind), 1, 1};
    append(message, static_cast<std::uint32_t>(body.size()));
    append(message, serial);
    append(message, static_cast<std::uint32_t>(fields.size()));
    append(message, std::span<const std::uint8_t>(fields));
    align(message, 8);
    append(message, std::span<const std::uint8_t>(body));
    return message;
}

Bus::Bus(const std::string& path, Random ideas, std::size_t silences)
    : listener_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)),
      stop_(::eventfd(0, EFD_CLOEXEC)),
      ideas_(ideas),
      silences_(silences) {
    const auto address = base::UnixAddress::of(path);
    require(address && ::bind(listener_.get(), address->get(), address->size()) == 0 &&
                ::listen(listener_.get(), 16) == 0,
            "cannot listen on " + path);
    thread_ = std::thread([this] { run(); });
}

Bus::~Bus() {
    const std::uint64_t one = 1;
    static_cast<void>(::write(stop_.get(), &one, sizeof one));
    thread_.join();
}

std::optional<std::uint64_t> Bus::toldTime() const {
    const std::lock_guard<std::mutex> guard(toldLock_);
    return toldTime_;
}

bool Bus::awaitInput(int connection) const {
    pollfd watched[2] = {{connection, POLLIN, 0}, {stop_.get(), POLLIN, 0}};
    while (::poll(watched, 2, -1) < 0 && errno == EINTR) {
    }
    return watched[1].revents == 0;
}

void Bus::run() {
    while (awaitInput(listener_.get())) {
        const base::FileDescriptor connection(
            ::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        if (connection.isOpen()) {
            serve(connection.get());
        }
    }
}

void Bus::serve(int connection) {
    if (!behaves_ && ideas_.oneIn(60)) {
        return;
    }
    if (!greet(connection)) {
        return;
    }
    while (const auto call = receiveCall(connection)) {
        ++exchanges_;
        if (!answer(connection, *call)) {
            return;
        }
    }
}

std::optional<Bytes> Bus::receive(int connection, std::size_t length) const {
    Bytes bytes(length);
    std::size_t done = 0;
    while (done < length) {
        if (!awaitInput(connection)) {
            return std::nullopt;
        }
        const ssize_t received = ::recv(connection, bytes.data() + done, length - done, 0);
        if (received <= 0) {
            return std::nullopt;
        }
        done += static_cast<std::size_t>(received);
    }
    return bytes;
}

/// The client says everything up to "BEGIN" at once, and its first call behind that.
bool Bus::greet(int connection) {
    std::string said;
    while (said.find("BEGIN\r\n") == std::string::npos) {
        const auto byte = receive(connection, 1);
        if (!byte) {
            return false;
        }
        said += static_cast<char>(byte->front());
    }
    Bytes answers;
    append(answers, std::string_view("OK 0123456789abcdef0123456789abcdef\r\n"));
    if (said.find("NEGOTIATE_UNIX_FD") != std::string::npos) {
        append(answers, std::string_view("AGREE_UNIX_FD\r\n"));
    }
    // "DATA" is what an empty identity is asked for with.
    if (said.find("AUTH EXTERNAL\r\n") != std::string::npos) {
        answers.insert(answers.begin(), {'D', 'A', 'T', 'A', '\r', '\n'});
    }
    if (!behaves_ && ideas_.oneIn(40)) {
        mutate(ideas_, answers);
        static_cast<void>(send(connection, answers));
        return false;
    }
    return send(connection, answers);
}

std::optional<BusMessage> Bus::receiveCall(int connection) {
    auto message = receive(connection, kFixedSize);
    if (!message) {
        return std::nullopt;
    }
    const std::size_t bodySize = readU32(*message, 4);
    const std::size_t fieldsSize = readU32(*message, 12);
    require(message->front() == 'l' && bodySize <= kLargestMessage && fieldsSize <= kLargestMessage,
            "a malformed message to the bus");
    const std::size_t end = kFixedSize + fieldsSize;
    const auto rest = receive(connection, (end + 7) / 8 * 8 - kFixedSize + bodySize);
    if (!rest) {
        return std::nullopt;
    }
    append(*message, std::span<const std::uint8_t>(*rest));
    return BusMessage{
        .kind = static_cast<BusMessage::Kind>((*message)[1]),
        .serial = readU32(*message, 8),
        .path = fieldText(*message, kPath, end),
        .interface = fieldText(*message, kInterface, end),
        .member = fieldText(*message, kMember, end),
        .body = Bytes(message->end() - static_cast<std::ptrdiff_t>(bodySize), message->end())};
}

bool Bus::send(int connection, const Bytes& bytes) const {
    std::size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t sent =
            ::send(connection, bytes.data() + done, bytes.size() - done, MSG_NOSIGNAL);
        if (sent <= 0) {
            return false;
        }
        done += static_cast<std::size_t>(sent);
    }
    return true;
}

BusMessage Bus::reply(const BusMessage& call, std::string signature, Bytes body) {
    return {.kind = BusMessage::Kind::reply,
            .serial = ++serial_,
            .replyTo = call.serial,
            .destination = kClient,
            .sender =
                call.path.starts_with("/org/freedesktop/DBus") ? "org.freedesktop.DBus" : kInit,
            .signature = std::move(signature),
            .body = std::move(body)};
}

Bytes Bus::jobRemoved(const std::string& job) {
    Bytes body;
    append(body, job_);
    appendString(body, job);
    appendString(body, kUnit);
    appendString(body, "done");
    return BusMessage{.kind = BusMessage::Kind::signal,
                      .serial = ++serial_,
                      .path = kManagerPath,
                      .interface = kManager,
                      .member = "JobRemoved",
                      .sender = kInit,
                      .signature = "uoss",
                      .body = std::move(body)}
        .encode();
}

Bytes Bus::properReplies(const BusMessage& call) {
    Bytes body;
    if (call.member == "Hello") {
        appendString(body, kClient);
        return reply(call, "s", std::move(body)).encode();
    }
    if (call.member == "Get") {
        appendSignature(body, "t");
        align(body, 8);
        append(body, timer_);
        const std::lock_guard<std::mutex> guard(toldLock_);
        toldTime_ = timer_;
        return reply(call, "v", std::move(body)).encode();
    }
    if (call.member.starts_with("St")) {
        timer_ = call.member == "StartTransientUnit" ? calendarTime(call.body) : ~std::uint64_t{0};
        servicesStarted_ += call.member == "StartUnit" ? 1 : 0;
        const std::string job = base::concat(kJobs, ++job_);
        appendString(body, job);
        Bytes replies = reply(call, "o", std::move(body)).encode();
        append(replies, std::span<const std::uint8_t>(jobRemoved(job)));
        return replies;
    }
    return reply(call, "", {}).encode();
}

Bytes Bus::hostileReplies(const BusMessage& call) {
    const auto forget = [this](std::optional<std::uint64_t> time) {
        const std::lock_guard<std::mutex> guard(toldLock_);
        toldTime_ = time;
    };
    Random& random = ideas_;
    // Not the greeting, or nothing else would come of the connection.
    if (call.member == "Hello" && !random.oneIn(40)) {
        return properReplies(call);
    }
    switch (random.below(40)) {
    case 0:
    case 1: {
        Bytes replies = properReplies(call);
        mutate(random, replies);
        breaksOff_ = true;
        return replies;
    }
    case 2: {
        static constexpr const char* kNames[] = {"org.freedesktop.systemd1.NoSuchUnit",
                                                 "org.freedesktop.DBus.Error.AccessDenied",
                                                 "org.freedesktop.systemd1.UnitExists", "a.b"};
        Bytes body;
        appendString(body, random.oneIn(2) ? "no" : std::string(random.length(3000), 'w'));
        BusMessage error = reply(call, random.oneIn(4) ? "" : "s", std::move(body));
        if (error.signature.empty()) {
            error.body.clear();
        }
        error.kind = BusMessage::Kind::error;
        error.errorName = random.of(kNames);
        forget(std::nullopt);
        return error.encode();
    }
    case 3: {
        // Of another type, or with nothing in it.
        static constexpr const char* kTypes[] = {"", "s", "o", "u", "v", "t"};
        const std::string type = random.of(kTypes);
        Bytes body;
        if (type == "s" || type == "o") {
            appendString(body, random.oneIn(2) ? "/a" : "/");
        } else if (type == "u") {
            append(body, static_cast<std::uint32_t>(random.number()));
        } else if (type == "t") {
            append(body, random.number());
        } else if (type == "v") {
            appendSignature(body, "u");
            align(body, 4);
            append(body, static_cast<std::uint32_t>(random.number()));
        }
        forget(std::nullopt);
        breaksOff_ = true;
        return reply(call, type, std::move(body)).encode();
    }
    case 4: {
        // Signals that nobody waits for, empty ones, ones of another job.
        Bytes replies;
        for (std::size_t count = random.below(20); count > 0; --count) {
            append(replies, std::span<const std::uint8_t>(
                                jobRemoved(base::concat(kJobs, random.below(10)))));
            if (random.oneIn(2)) {
                append(replies,
                       std::span<const std::uint8_t>(BusMessage{.kind = BusMessage::Kind::signal,
                                                                .serial = ++serial_,
                                                                .path = kManagerPath,
                                                                .interface = kManager,
                                                                .member = "JobRemoved",
                                                                .sender = kInit}
                                                         .encode()));
            }
        }
        append(replies, std::span<const std::uint8_t>(properReplies(call)));
        return replies;
    }
    case 5: {
        Bytes replies = properReplies(call);
        append(replies, std::span<const std::uint8_t>(replies));
        return replies;
    }
    case 6:
        breaksOff_ = true;
        return random.bytes(random.length(300));
    case 7:
        if (call.member == "Get") {
            // Any time instead of the timer's.
            const std::uint64_t time = random.number();
            Bytes body;
            appendSignature(body, "t");
            align(body, 8);
            append(body, time);
            forget(time);
            return reply(call, "v", std::move(body)).encode();
        }
        return properReplies(call);
    default:
        return properReplies(call);
    }
}

/// Of other jobs, before or in the place of the end of the one that is waited for.
void Bus::talk(int connection, const BusMessage& call, bool forEver) {
    const std::string job = base::concat(kJobs, 1);
    Bytes body;
    appendString(body, job);
    Bytes words = reply(call, "o", std::move(body)).encode();
    for (int i = 0; i < 500; ++i) {
        append(words, std::span<const std::uint8_t>(jobRemoved(base::concat(kJobs, 2))));
    }
    if (!forEver) {
        append(words, std::span<const std::uint8_t>(jobRemoved(job)));
    }
    pollfd stopped{stop_.get(), POLLIN, 0};
    while (send(connection, words) && forEver && ::poll(&stopped, 1, 0) == 0) {
    }
}

bool Bus::answer(int connection, const BusMessage& call) {
    const bool beginsJob = call.member.starts_with("St");
    if (isTalkative_ && beginsJob) {
        talk(connection, call, false);
        return true;
    }
    if (behaves_) {
        return send(connection, properReplies(call));
    }
    if (silences_ > 0 && ideas_.oneIn(2000)) {
        --silences_;
        if (beginsJob && ideas_.oneIn(2)) {
            talk(connection, call, true);
            return false;
        }
        return true;
    }
    // What may be no answer to the client would be waited for.
    breaksOff_ = ideas_.oneIn(60);
    const Bytes replies = hostileReplies(call);
    return send(connection, replies) && !breaksOff_;
}

} // namespace neighbours
