#pragma once

#include "base/FileDescriptor.h"
#include "platform/linux/EventSocket.h"
#include "wire/AlarmAnswer.h"

#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <optional>
#include <string>
#include <sys/socket.h>
#include <utility>
#include <vector>

namespace platform {

/// The alarm's helper as far as it has a socket and answers as it is told to.
class FakeAlarmHelper {
  public:
    struct Question {
        /// Where to answer; closed when no answer is asked for.
        base::FileDescriptor answers{};

        void answer(const std::vector<std::uint8_t>& bytes) const {
            EXPECT_EQ(::send(answers.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL),
                      static_cast<ssize_t>(bytes.size()));
        }
        void answer(const wire::AlarmAnswer& words) const {
            answer(wire::encodeAlarmAnswer(words));
        }
    };

    explicit FakeAlarmHelper(const std::string& path) : socket_(makeEventSocket(path)) {}

    /// The next that is in the socket's queue.
    [[nodiscard]] std::optional<Question> question() const {
        char content = 0;
        iovec data{&content, sizeof content};
        alignas(cmsghdr)
            std::array<std::uint8_t, CMSG_SPACE(sizeof(ucred)) + CMSG_SPACE(sizeof(int))>
                control{};
        msghdr message{};
        message.msg_iov = &data;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        if (::recvmsg(socket_.get(), &message, MSG_DONTWAIT) < 0) {
            return std::nullopt;
        }
        Question found;
        for (cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr;
             part = CMSG_NXTHDR(&message, part)) {
            if (part->cmsg_type == SCM_RIGHTS) {
                int number = -1;
                std::memcpy(&number, CMSG_DATA(part), sizeof number);
                found.answers = base::FileDescriptor(number);
            }
        }
        return found;
    }

  private:
    base::FileDescriptor socket_;
};

} // namespace platform
