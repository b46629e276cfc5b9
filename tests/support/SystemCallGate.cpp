#include "tests/support/SystemCallGate.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <poll.h>
#include <stdexcept>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

namespace support {

namespace {

#if defined(__x86_64__)
constexpr std::uint32_t kArchitecture = AUDIT_ARCH_X86_64;
#elif defined(__aarch64__)
constexpr std::uint32_t kArchitecture = AUDIT_ARCH_AARCH64;
#endif

/// Where the new process hands its listener over; no program has as many descriptors.
constexpr int kHandOver = 200;

/// Calls that nobody is interested in: they cannot fail, or are so many that asking would only
/// cost time.
constexpr std::array kPassed = {
    SYS_futex,         SYS_rt_sigreturn,    SYS_exit,   SYS_exit_group, SYS_sched_yield,
    SYS_clock_gettime, SYS_clock_nanosleep, SYS_gettid, SYS_getpid,     SYS_rt_sigprocmask,
    SYS_rt_sigaction,  SYS_set_robust_list, SYS_rseq,   SYS_geteuid,    SYS_getuid};

constexpr std::uint32_t offsetOfArgument(int index) {
    return static_cast<std::uint32_t>(offsetof(seccomp_data, args)) +
           8U * static_cast<std::uint32_t>(index);
}

std::vector<sock_filter> filter() {
    constexpr sock_filter kPass = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
    constexpr std::uint16_t kLoad = BPF_LD | BPF_W | BPF_ABS;
    constexpr std::uint16_t kIfEqual = BPF_JMP | BPF_JEQ | BPF_K;
    std::vector<sock_filter> steps = {
        BPF_STMT(kLoad, offsetof(seccomp_data, arch)),
        BPF_JUMP(kIfEqual, kArchitecture, 1, 0),
        kPass,
        // The one message by which the listener is handed over, before anybody listens.
        BPF_STMT(kLoad, offsetof(seccomp_data, nr)),
        BPF_JUMP(kIfEqual, SYS_sendmsg, 0, 3),
        BPF_STMT(kLoad, offsetOfArgument(0)),
        BPF_JUMP(kIfEqual, kHandOver, 0, 1),
        kPass,
        BPF_STMT(kLoad, offsetof(seccomp_data, nr)),
    };
    for (const long number : kPassed) {
        steps.push_back(BPF_JUMP(kIfEqual, static_cast<std::uint32_t>(number), 0, 1));
        steps.push_back(kPass);
    }
    steps.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_USER_NOTIF));
    return steps;
}

/// A message of one byte with room for one descriptor.
struct DescriptorMessage {
    DescriptorMessage() {
        header.msg_iov = &data;
        header.msg_iovlen = 1;
        header.msg_control = control;
        header.msg_controllen = sizeof control;
    }

    char content = 1;
    iovec data{&content, sizeof content};
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    msghdr header{};
};

void handOver(int socket, int descriptor) {
    DescriptorMessage message;
    cmsghdr* const rights = CMSG_FIRSTHDR(&message.header);
    rights->cmsg_level = SOL_SOCKET;
    rights->cmsg_type = SCM_RIGHTS;
    rights->cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(rights), &descriptor, sizeof descriptor);
    if (::syscall(SYS_sendmsg, socket, &message.header, 0) < 0) {
        ::_exit(126);
    }
}

base::FileDescriptor takeOver(int socket) {
    DescriptorMessage message;
    int descriptor = -1;
    if (::recvmsg(socket, &message.header, MSG_CMSG_CLOEXEC) > 0) {
        if (const cmsghdr* const rights = CMSG_FIRSTHDR(&message.header)) {
            std::memcpy(&descriptor, CMSG_DATA(rights), sizeof descriptor);
        }
    }
    return base::FileDescriptor(descriptor);
}

/// In the new process: from here on its calls wait for the judge.
void enterGate(const std::vector<sock_filter>& steps, int socket) {
    const sock_fprog program{static_cast<unsigned short>(steps.size()),
                             const_cast<sock_filter*>(steps.data())};
    // Close-on-exec of its own, whatever number the socket had.
    ::dup3(socket, kHandOver, O_CLOEXEC);
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    const long listener = ::syscall(
        SYS_seccomp, SECCOMP_SET_MODE_FILTER,
        SECCOMP_FILTER_FLAG_NEW_LISTENER | SECCOMP_FILTER_FLAG_WAIT_KILLABLE_RECV, &program);
    if (listener < 0) {
        ::_exit(126);
    }
    handOver(kHandOver, static_cast<int>(listener));
}

template <typename Record>
Record& inBuffer(std::vector<std::uint8_t>& buffer) {
    return *reinterpret_cast<Record*>(buffer.data());
}

} // namespace

std::string SystemCall::fileBehind(int descriptor) const {
    std::error_code error;
    const std::string proc = "/proc/" + std::to_string(thread);
    return std::filesystem::read_symlink(
               descriptor == AT_FDCWD ? proc + "/cwd" : proc + "/fd/" + std::to_string(descriptor),
               error)
        .string();
}

std::vector<std::uint8_t> SystemCall::bytesAt(std::uint64_t address, std::size_t size) const {
    std::vector<std::uint8_t> bytes(size);
    const iovec mine{bytes.data(), size};
    const iovec theirs{reinterpret_cast<void*>(address), size};
    const ssize_t count = ::process_vm_readv(thread, &mine, 1, &theirs, 1, 0);
    bytes.resize(count > 0 ? static_cast<std::size_t>(count) : 0);
    return bytes;
}

std::string SystemCall::textAt(std::uint64_t address) const {
    constexpr std::uint64_t kPageSize = 4096;
    std::string text;
    while (text.size() < PATH_MAX) {
        const std::uint64_t from = address + text.size();
        const auto bytes = bytesAt(from, kPageSize - from % kPageSize);
        const auto end = std::find(bytes.begin(), bytes.end(), 0);
        text.append(bytes.begin(), end);
        if (end != bytes.end() || bytes.empty()) {
            break;
        }
    }
    return text;
}

std::string SystemCall::pathAt(int directory, std::uint64_t address) const {
    const std::string text = textAt(address);
    return text.starts_with('/')
               ? text
               : (std::filesystem::path(fileBehind(directory)) / text).lexically_normal().string();
}

SystemCallGate::SystemCallGate(const std::vector<std::string>& arguments, Judge judge,
                               const std::function<void()>& prepare)
    : judge_(std::move(judge)), end_(::eventfd(0, EFD_CLOEXEC)) {
    seccomp_notif_sizes sizes{};
    if (::syscall(SYS_seccomp, SECCOMP_GET_NOTIF_SIZES, 0, &sizes) != 0) {
        throw std::runtime_error("the system shows nobody's system calls");
    }
    notification_.resize(std::max<std::size_t>(sizes.seccomp_notif, sizeof(seccomp_notif)));
    answer_.resize(std::max<std::size_t>(sizes.seccomp_notif_resp, sizeof(seccomp_notif_resp)));
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        throw std::runtime_error("cannot make a pair of sockets");
    }
    const base::FileDescriptor mine(ends[0]);
    base::FileDescriptor theirs(ends[1]);
    const auto enter = [&prepare, steps = filter(), socket = theirs.get()] {
        // What a sanitizer does at the end are calls that are not the program's.
        ::setenv("ASAN_OPTIONS", "detect_leaks=0", 1);
        if (prepare) {
            prepare();
        }
        enterGate(steps, socket);
    };
    program_ = std::make_unique<Program>(arguments, Program::Input::ofTest, enter);
    theirs.reset();
    listener_ = takeOver(mine.get());
    if (!listener_.isOpen()) {
        throw std::runtime_error("the program does not show its system calls");
    }
    server_ = std::thread([this] { serve(); });
}

SystemCallGate::~SystemCallGate() {
    program_.reset();
    const std::uint64_t one = 1;
    static_cast<void>(::write(end_.get(), &one, sizeof one));
    server_.join();
}

void SystemCallGate::serve() {
    for (;;) {
        pollfd watched[2] = {{listener_.get(), POLLIN, 0}, {end_.get(), POLLIN, 0}};
        if (::poll(watched, 2, -1) < 0 && errno != EINTR) {
            return;
        }
        if ((watched[0].revents & POLLIN) != 0) {
            serveOne();
        } else if (watched[0].revents != 0 || watched[1].revents != 0) {
            // Nobody is left to make calls, or nobody wants to know.
            return;
        }
    }
}

void SystemCallGate::serveOne() {
    std::fill(notification_.begin(), notification_.end(), 0);
    std::fill(answer_.begin(), answer_.end(), 0);
    auto& notification = inBuffer<seccomp_notif>(notification_);
    if (::ioctl(listener_.get(), SECCOMP_IOCTL_NOTIF_RECV, &notification) != 0) {
        return;
    }
    SystemCall call;
    call.thread = static_cast<pid_t>(notification.pid);
    call.number = notification.data.nr;
    call.program = programOf(call.thread, call.number);
    std::copy(std::begin(notification.data.args), std::end(notification.data.args),
              call.arguments.begin());
    const int error = judge_(call);
    auto& answer = inBuffer<seccomp_notif_resp>(answer_);
    answer.id = notification.id;
    answer.error = -error;
    answer.flags = error == 0 ? SECCOMP_USER_NOTIF_FLAG_CONTINUE : 0;
    // Who was killed meanwhile does not wait for it.
    ::ioctl(listener_.get(), SECCOMP_IOCTL_NOTIF_SEND, &answer);
}

std::string SystemCallGate::programOf(pid_t thread, int number) {
    const bool becomesAnother = number == SYS_execve;
    const auto known = programs_.find(thread);
    if (known != programs_.end() && !becomesAnother) {
        return known->second;
    }
    std::error_code error;
    const auto file =
        std::filesystem::read_symlink("/proc/" + std::to_string(thread) + "/exe", error);
    if (becomesAnother) {
        programs_.erase(thread);
    } else {
        programs_.emplace(thread, file.filename().string());
    }
    return file.filename().string();
}

} // namespace support
