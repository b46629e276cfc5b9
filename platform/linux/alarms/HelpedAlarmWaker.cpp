#include "platform/linux/alarms/HelpedAlarmWaker.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"
#include "platform/MessageClasses.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <sys/socket.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {

namespace {

constexpr char kNoAnswer[] = "its helper does not answer";

std::string systemReason() {
    return std::generic_category().message(errno);
}

/// Two connected sockets, the first of which is told who sends. Neither is open when there are
/// none.
std::pair<base::FileDescriptor, base::FileDescriptor> makePair() {
    int ends[2] = {-1, -1};
    const int on = 1;
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) != 0) {
        return {};
    }
    std::pair pair{base::FileDescriptor(ends[0]), base::FileDescriptor(ends[1])};
    ::setsockopt(ends[0], SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
    return pair;
}

/// Why the helper could not be told; empty when it was. `answers`, where it is to answer, may be
/// -1.
std::string tell(const std::string& socketPath, int answers) {
    const auto address = base::UnixAddress::of(socketPath);
    if (!address) {
        return "the socket's path is too long";
    }
    const base::FileDescriptor sender(
        ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    char content = 1;
    iovec data{&content, sizeof content};
    alignas(cmsghdr) std::array<std::uint8_t, CMSG_SPACE(sizeof answers)> control{};
    sockaddr_storage receiver{};
    std::memcpy(&receiver, address->get(), address->size());
    msghdr message{};
    message.msg_name = &receiver;
    message.msg_namelen = address->size();
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    if (answers >= 0) {
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        cmsghdr* const rights = CMSG_FIRSTHDR(&message);
        rights->cmsg_level = SOL_SOCKET;
        rights->cmsg_type = SCM_RIGHTS;
        rights->cmsg_len = CMSG_LEN(sizeof answers);
        std::memcpy(CMSG_DATA(rights), &answers, sizeof answers);
    }
    const bool isSent =
        sender.isOpen() && ::sendmsg(sender.get(), &message, MSG_DONTWAIT | MSG_NOSIGNAL) >= 0;
    return isSent ? std::string() : systemReason();
}

/// Whether the message came from root, or from who runs this process.
bool isTrusted(const msghdr& message) {
    const cmsghdr* const control = CMSG_FIRSTHDR(&message);
    if (control == nullptr || control->cmsg_level != SOL_SOCKET ||
        control->cmsg_type != SCM_CREDENTIALS || control->cmsg_len < CMSG_LEN(sizeof(ucred))) {
        return false;
    }
    ucred credentials{};
    std::memcpy(&credentials, CMSG_DATA(control), sizeof credentials);
    return credentials.uid == 0 || credentials.uid == ::geteuid();
}

/// The helper's answer; when there is none that counts, `problem` says why.
std::optional<wire::AlarmAnswer> receiveAnswer(int socket, std::string& problem) {
    std::array<std::uint8_t, wire::kAlarmAnswerMaxSize> buffer{};
    iovec data{buffer.data(), buffer.size()};
    alignas(cmsghdr) std::array<std::uint8_t, CMSG_SPACE(sizeof(ucred))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t length = ::recvmsg(socket, &message, MSG_DONTWAIT | MSG_TRUNC | MSG_CMSG_CLOEXEC);
    if (length <= 0) {
        problem = length == 0 ? "its helper has ended without an answer" : systemReason();
        return std::nullopt;
    }
    if (!isTrusted(message)) {
        problem = "somebody else answers in the place of its helper";
        return std::nullopt;
    }
    const auto size = static_cast<std::size_t>(length);
    const auto answer =
        size <= buffer.size() ? wire::decodeAlarmAnswer({buffer.data(), size}) : std::nullopt;
    if (!answer) {
        problem = "its helper's answer is malformed";
    }
    return answer;
}

} // namespace

HelpedAlarmWaker::HelpedAlarmWaker(std::string helperSocket, LinuxRunLoop& loop,
                                   AlarmWaker& inProcess, SystemLog& log,
                                   std::chrono::microseconds patience)
    : helperSocket_(std::move(helperSocket)),
      loop_(loop),
      inProcess_(inProcess),
      log_(log),
      patience_(patience),
      timer_(loop.addTimer([this] { patienceIsOver(); })) {}

void HelpedAlarmWaker::arm(Date date) {
    unconfirmed_ = date;
    inProcess_.arm(date);
    ask();
}

void HelpedAlarmWaker::disarm() {
    settle();
    ask();
}

void HelpedAlarmWaker::tryAgain() {
    if (unconfirmed_ && !isTimerRunning_) {
        ask();
    }
}

void HelpedAlarmWaker::close() {
    dropQuestion();
    timer_.reset();
    inProcess_.close();
}

/// An answer to an earlier question finds nobody any more.
void HelpedAlarmWaker::ask() {
    dropQuestion();
    if (!timer_) {
        static_cast<void>(tell(helperSocket_, -1));
        return;
    }
    if (unconfirmed_ && !std::exchange(isTimerRunning_, true)) {
        timer_->fireAfter(patience_);
    }
    auto [mine, helpers] = makePair();
    problem_ = mine.isOpen() ? tell(helperSocket_, helpers.get()) : systemReason();
    if (problem_.empty()) {
        awaitAnswer(std::move(mine));
    }
}

void HelpedAlarmWaker::awaitAnswer(base::FileDescriptor answers) {
    try {
        answersSource_ = loop_.addReadable(answers.get(), [this] { answerArrived(); });
        answers_ = std::move(answers);
        problem_ = kNoAnswer;
    } catch (const std::system_error& error) {
        // The answer finds nobody: this process waits itself, as if there were no helper.
        problem_ = error.code().message();
    }
}

void HelpedAlarmWaker::dropQuestion() {
    answersSource_.reset();
    answers_.reset();
}

void HelpedAlarmWaker::answerArrived() {
    const auto answer = receiveAnswer(answers_.get(), problem_);
    dropQuestion();
    if (answer) {
        take(*answer);
    }
}

void HelpedAlarmWaker::take(const wire::AlarmAnswer& answer) {
    if (!unconfirmed_) {
        return;
    }
    if (answer.timer == wire::AlarmAnswer::Timer::failed) {
        problem_ = answer.reason;
    } else if (answer.timer == wire::AlarmAnswer::Timer::none ||
               unconfirmed_ != Date{answer.date}) {
        problem_ = "its helper does not find the alarm on disk";
    } else {
        settle();
        if (!answer.wakesMachine) {
            sayThatItDoesNotWake();
        }
    }
}

/// There is nothing more to be asked for.
void HelpedAlarmWaker::settle() {
    dropQuestion();
    unconfirmed_.reset();
    saidThatItWaits_ = false;
    inProcess_.disarm();
    if (timer_) {
        timer_->setEnabled(false);
        isTimerRunning_ = false;
    }
}

void HelpedAlarmWaker::patienceIsOver() {
    isTimerRunning_ = false;
    if (std::exchange(saidThatItWaits_, true)) {
        return;
    }
    log_.write(LogLevel::warning,
               base::concat("kstd: AlarmWaker: no timer of the init system: ", problem_,
                            "; the daemon stays to wait for its alarm.\n"),
               {.messageId = message::kAlarmWithoutInitSystem});
}

/// Once in a process.
void HelpedAlarmWaker::sayThatItDoesNotWake() {
    if (std::exchange(saidThatItDoesNotWake_, true)) {
        return;
    }
    log_.write(LogLevel::info,
               "kstd: AlarmWaker: this machine cannot be woken from sleep; an alarm that comes due "
               "meanwhile waits until it is awake.\n",
               {.messageId = message::kAlarmDoesNotWake});
}

} // namespace platform
