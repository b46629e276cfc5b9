#include "kstd-notify/AlarmHelper.h"

#include "platform/host/LogText.h"
#include "wire/EventDatagram.h"

#include <systemd/sd-daemon.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ostream>
#include <string_view>
#include <sys/socket.h>
#include <unistd.h>

namespace notify {

namespace {

constexpr char kActivationName[] = "alarms";

bool isTrusted(const cmsghdr& control) {
    ucred credentials{};
    std::memcpy(&credentials, CMSG_DATA(&control), sizeof credentials);
    return credentials.uid == 0 || credentials.uid == ::geteuid();
}

/// The first of the descriptors; the others are closed.
base::FileDescriptor firstDescriptor(const cmsghdr& control) {
    base::FileDescriptor first;
    const std::size_t count = (control.cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
        int number = -1;
        std::memcpy(&number, CMSG_DATA(&control) + i * sizeof number, sizeof number);
        base::FileDescriptor descriptor(number);
        if (i == 0) {
            first = std::move(descriptor);
        }
    }
    return first;
}

} // namespace

AlarmHelper::AlarmHelper(base::FileDescriptor socket, platform::AlarmStore& store,
                         AlarmTimerUnit& unit, AlarmTimer& timer, platform::Clock& clock,
                         std::ostream& errors)
    : socket_(std::move(socket)),
      store_(store),
      unit_(unit),
      timer_(timer),
      clock_(clock),
      errors_(errors) {
    const int on = 1;
    ::setsockopt(socket_.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on);
}

bool AlarmHelper::run() {
    std::vector<Question> questions = takeQuestions();
    bool isDone = bringUpToDate(questions);
    while (!(questions = takeQuestions()).empty()) {
        isDone = bringUpToDate(questions);
    }
    return isDone;
}

bool AlarmHelper::bringUpToDate(const std::vector<Question>& questions) {
    const auto [areDue, next] = alarms();
    const wire::AlarmAnswer answer = timer_.set(next);
    const bool hasFailed = answer.timer == wire::AlarmAnswer::Timer::failed;
    if (hasFailed) {
        report(answer.reason);
    }
    const std::vector<std::uint8_t> bytes = wire::encodeAlarmAnswer(answer);
    // Only now that the timer is where it has to be: who is told relies on it.
    const auto told = std::count_if(questions.begin(), questions.end(), [&](const Question& asked) {
        return ::send(asked.answers.get(), bytes.data(), bytes.size(),
                      MSG_DONTWAIT | MSG_NOSIGNAL) >= 0;
    });
    if (told > 0) {
        return true;
    }
    // Nobody asked, or who did is gone: then nobody else fires what is due.
    const auto error = areDue ? unit_.elapseNow() : std::nullopt;
    if (error) {
        report(error->description);
    }
    // A timer that stays though there is no alarm finds nothing to send when it elapses.
    return !error && (!hasFailed || !next);
}

AlarmHelper::Alarms AlarmHelper::alarms() {
    Alarms found;
    const platform::Date now = clock_.now();
    for (const auto& [event, date] : store_.load(wire::kAlarmStream)) {
        if (date <= now) {
            found.areDue = true;
        } else if (!found.next || date < *found.next) {
            found.next = date;
        }
    }
    return found;
}

void AlarmHelper::report(const std::string& reason) {
    errors_ << "kstd-notify: no timer for the alarm: " << platform::printableLine(reason) << '\n';
}

std::vector<AlarmHelper::Question> AlarmHelper::takeQuestions() {
    std::vector<Question> questions;
    while (auto question = receive()) {
        if (question->counts) {
            questions.push_back(std::move(*question));
        } else {
            errors_ << "kstd-notify: another user's word about the alarms was dropped\n";
        }
    }
    return questions;
}

/// None when the queue is empty.
std::optional<AlarmHelper::Question> AlarmHelper::receive() {
    // What is said does not matter, so one byte has room enough and the rest is cut off.
    char content = 0;
    iovec data{&content, sizeof content};
    alignas(cmsghdr) std::array<std::uint8_t, CMSG_SPACE(sizeof(ucred)) + CMSG_SPACE(sizeof(int))>
        control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    ssize_t length = -1;
    do {
        length = ::recvmsg(socket_.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    } while (length < 0 && errno == EINTR);
    if (length < 0) {
        return std::nullopt;
    }
    Question question;
    for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr;
         part = CMSG_NXTHDR(&message, part)) {
        if (part->cmsg_level == SOL_SOCKET && part->cmsg_type == SCM_CREDENTIALS) {
            question.counts = isTrusted(*part);
        } else if (part->cmsg_level == SOL_SOCKET && part->cmsg_type == SCM_RIGHTS) {
            question.answers = firstDescriptor(*part);
        }
    }
    return question;
}

base::FileDescriptor takeActivatedAlarmSocket() {
    char** names = nullptr;
    const int count = sd_listen_fds_with_names(1, &names);
    base::FileDescriptor found;
    for (int i = 0; i < count; ++i) {
        base::FileDescriptor candidate(SD_LISTEN_FDS_START + i);
        if (!found.isOpen() && std::string_view(names[i]) == kActivationName &&
            sd_is_socket(candidate.get(), AF_UNIX, SOCK_DGRAM, -1) > 0) {
            found = std::move(candidate);
        }
        std::free(names[i]);
    }
    std::free(names);
    return found;
}

} // namespace notify
