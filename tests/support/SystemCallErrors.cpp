#include "tests/support/SystemCallErrors.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <fcntl.h>
#include <fstream>
#include <map>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>

namespace support {

namespace {

using Errors = std::vector<int>;

/// Which argument of a call says what it is about.
enum class About { nothing, descriptor, path, pathAt };

struct Known {
    const char* name;
    About about;
    Errors errors;
};

const Errors kLookups = {EACCES, EIO, ENOENT, ENOMEM};
const Errors kChanges = {EACCES, EDQUOT, EIO, ENOENT, ENOMEM, ENOSPC, EROFS};
const Errors kNewDescriptor = {EMFILE, ENFILE, ENOMEM};
const Errors kMemory = {ENOMEM};

const std::map<long, Known>& known() {
    static const std::map<long, Known> all = {
        {SYS_openat, {"openat", About::pathAt, {}}},
        {SYS_read, {"read", About::descriptor, {}}},
        {SYS_pread64, {"pread64", About::descriptor, {EINTR, EIO}}},
        {SYS_write, {"write", About::descriptor, {}}},
        {SYS_writev, {"writev", About::descriptor, {}}},
        {SYS_pwrite64, {"pwrite64", About::descriptor, {EDQUOT, EFBIG, EINTR, EIO, ENOSPC, EPERM}}},
        {SYS_fsync, {"fsync", About::descriptor, {EDQUOT, EINTR, EIO, ENOSPC}}},
        {SYS_fdatasync, {"fdatasync", About::descriptor, {EDQUOT, EINTR, EIO, ENOSPC}}},
        {SYS_ftruncate, {"ftruncate", About::descriptor, {EFBIG, EINTR, EIO, EPERM}}},
        {SYS_fallocate,
         {"fallocate", About::descriptor, {EFBIG, EINTR, EIO, ENOSPC, EOPNOTSUPP, EPERM}}},
        {SYS_close, {"close", About::descriptor, {}}},
        {SYS_fstat, {"fstat", About::descriptor, {EIO, ENOMEM}}},
        {SYS_newfstatat, {"newfstatat", About::pathAt, kLookups}},
        {SYS_statx, {"statx", About::pathAt, kLookups}},
        {SYS_faccessat, {"faccessat", About::pathAt, kLookups}},
        {SYS_readlinkat, {"readlinkat", About::pathAt, kLookups}},
        {SYS_getdents64, {"getdents64", About::descriptor, {EIO, ENOMEM}}},
        {SYS_fchmod, {"fchmod", About::descriptor, {EIO, EPERM, EROFS}}},
        {SYS_fchmodat, {"fchmodat", About::pathAt, {EIO, ENOENT, EPERM, EROFS}}},
        {SYS_fchown, {"fchown", About::descriptor, {EIO, EPERM, EROFS}}},
        {SYS_fchownat, {"fchownat", About::pathAt, {EIO, EPERM, EROFS}}},
        {SYS_unlinkat, {"unlinkat", About::pathAt, kChanges}},
        {SYS_mkdirat, {"mkdirat", About::pathAt, kChanges}},
        {SYS_fcntl, {"fcntl", About::descriptor, {}}},
        {SYS_socket, {"socket", About::nothing, {EACCES, EMFILE, ENFILE, ENOBUFS, ENOMEM}}},
        {SYS_socketpair, {"socketpair", About::nothing, kNewDescriptor}},
        {SYS_connect,
         {"connect",
          About::descriptor,
          {EACCES, EAGAIN, ECONNREFUSED, EINTR, ENOENT, ENOMEM, EPERM, ETIMEDOUT}}},
        {SYS_sendto,
         {"sendto",
          About::descriptor,
          {EAGAIN, ECONNREFUSED, ECONNRESET, EINTR, ENOBUFS, ENOENT, ENOMEM, EPERM, EPIPE}}},
        {SYS_sendmsg,
         {"sendmsg",
          About::descriptor,
          {EAGAIN, ECONNREFUSED, ECONNRESET, EINTR, EMSGSIZE, ENOBUFS, ENOENT, ENOMEM, EPERM,
           EPIPE}}},
        {SYS_recvfrom,
         {"recvfrom", About::descriptor, {EAGAIN, ECONNRESET, EINTR, ENOMEM, ETIMEDOUT}}},
        {SYS_recvmsg, {"recvmsg", About::descriptor, {EAGAIN, ECONNRESET, EINTR, ENOMEM}}},
        {SYS_getsockopt, {"getsockopt", About::descriptor, {ENOBUFS}}},
        {SYS_getsockname, {"getsockname", About::descriptor, {ENOBUFS}}},
        {SYS_ppoll, {"ppoll", About::nothing, {EINTR, ENOMEM}}},
        {SYS_epoll_create1, {"epoll_create1", About::nothing, kNewDescriptor}},
        {SYS_epoll_ctl, {"epoll_ctl", About::nothing, {}}},
        {SYS_epoll_pwait, {"epoll_pwait", About::nothing, {EINTR}}},
        {SYS_timerfd_create,
         {"timerfd_create", About::nothing, {EMFILE, ENFILE, ENODEV, ENOMEM, EPERM}}},
        {SYS_timerfd_settime, {"timerfd_settime", About::nothing, {ECANCELED}}},
        {SYS_signalfd4, {"signalfd4", About::nothing, {EMFILE, ENFILE, ENODEV, ENOMEM}}},
        {SYS_inotify_init1, {"inotify_init1", About::nothing, kNewDescriptor}},
        {SYS_inotify_add_watch,
         {"inotify_add_watch", About::nothing, {EACCES, ENOENT, ENOMEM, ENOSPC}}},
        {SYS_eventfd2, {"eventfd2", About::nothing, {EMFILE, ENFILE, ENODEV, ENOMEM}}},
        {SYS_pidfd_open, {"pidfd_open", About::nothing, {EMFILE, ENFILE, ENODEV, ENOMEM}}},
        {SYS_clone3, {"clone3", About::nothing, {EAGAIN, ENOMEM}}},
        {SYS_execve, {"execve", About::path, {E2BIG, EACCES, EIO, ENOENT, ENOMEM, ETXTBSY}}},
        {SYS_dup3, {"dup3", About::nothing, {EINTR, EMFILE}}},
        {SYS_wait4, {"wait4", About::nothing, {EINTR}}},
        {SYS_statfs, {"statfs", About::path, kLookups}},
        {SYS_fstatfs, {"fstatfs", About::descriptor, {EIO, ENOMEM}}},
        {SYS_getrandom, {"getrandom", About::nothing, {EINTR}}},
#ifndef KSTD_SANITIZED
        {SYS_clone, {"clone", About::nothing, {EAGAIN, ENOMEM}}},
        {SYS_pipe2, {"pipe2", About::nothing, kNewDescriptor}},
        {SYS_mmap, {"mmap", About::nothing, {EAGAIN, ENOMEM}}},
        {SYS_mprotect, {"mprotect", About::nothing, kMemory}},
        {SYS_mremap, {"mremap", About::nothing, kMemory}},
#endif
#ifdef SYS_open
        {SYS_open, {"open", About::path, {}}},
        {SYS_stat, {"stat", About::path, kLookups}},
        {SYS_lstat, {"lstat", About::path, kLookups}},
        {SYS_access, {"access", About::path, kLookups}},
        {SYS_readlink, {"readlink", About::path, kLookups}},
        {SYS_unlink, {"unlink", About::path, kChanges}},
        {SYS_mkdir, {"mkdir", About::path, kChanges}},
        {SYS_rmdir, {"rmdir", About::path, kChanges}},
        {SYS_rename, {"rename", About::path, kChanges}},
        {SYS_chmod, {"chmod", About::path, {EIO, ENOENT, EPERM, EROFS}}},
        {SYS_chown, {"chown", About::path, {EIO, EPERM, EROFS}}},
        {SYS_dup2, {"dup2", About::nothing, {EINTR, EMFILE}}},
        {SYS_pipe, {"pipe", About::nothing, kNewDescriptor}},
        {SYS_poll, {"poll", About::nothing, {EINTR, ENOMEM}}},
        {SYS_epoll_wait, {"epoll_wait", About::nothing, {EINTR}}},
        {SYS_vfork, {"vfork", About::nothing, {EAGAIN, ENOMEM}}},
#endif
    };
    return all;
}

const Known* lookUp(const SystemCall& call) {
    const auto found = known().find(call.number);
    return found == known().end() ? nullptr : &found->second;
}

int descriptorOf(const SystemCall& call) {
    return static_cast<int>(call.arguments[0]);
}

/// "socket:[4711]" is a socket, "anon_inode:[eventpoll]" an eventpoll.
std::string kindOf(const std::string& file) {
    if (file.starts_with("anon_inode:")) {
        const auto first = file.find_first_of('[');
        return first == std::string::npos ? file.substr(11)
                                          : file.substr(first + 1, file.find(']') - first - 1);
    }
    return file.substr(0, file.starts_with('/') ? std::string::npos : file.find(':'));
}

Errors errorsOfOpening(std::uint64_t flags) {
    Errors errors = {EACCES, EINTR, EIO, EMFILE, ENFILE, ENOMEM};
    // What is gone is nothing to read, and no failure; what is to be written to has gone meanwhile.
    if ((flags & O_ACCMODE) != O_RDONLY) {
        errors.insert(errors.end(), {ENOENT, EROFS});
    }
    if ((flags & O_CREAT) != 0) {
        errors.insert(errors.end(), {EDQUOT, ENOSPC});
    }
    return errors;
}

/// Reading and writing depend on what is behind the descriptor.
Errors errorsOfTransfer(const SystemCall& call, const Errors& ofFiles) {
    const std::string object = objectOf(call);
    if (object.starts_with('/')) {
        return ofFiles;
    }
#ifdef KSTD_SANITIZED
    // The sanitizers ask by a pipe whether memory can be read.
    if (object == "pipe") {
        return {};
    }
#endif
    if (object == "socket" || object == "pipe") {
        return object == "pipe" ? Errors{EAGAIN, EINTR, EPIPE}
                                : Errors{EAGAIN, ECONNRESET, EINTR, EPIPE};
    }
    return object == "timerfd" ? Errors{EAGAIN, ECANCELED, EINTR} : Errors{EAGAIN, EINTR};
}

/// Whether there is a file behind the descriptor that can be written through it.
bool isOpenForWriting(const SystemCall& call) {
    std::ifstream info("/proc/" + std::to_string(call.thread) + "/fdinfo/" +
                       std::to_string(descriptorOf(call)));
    for (std::string word; info >> word;) {
        unsigned flags = 0;
        if (word == "flags:" && info >> std::oct >> flags) {
            return (flags & O_ACCMODE) != O_RDONLY && objectOf(call).starts_with('/');
        }
    }
    return false;
}

Errors errorsOfControl(const SystemCall& call) {
    switch (call.arguments[1]) {
    case F_SETLK:
    case F_OFD_SETLK: {
        // Giving a lock back is not refused. The kind comes first in the structure.
        const auto kind = call.bytesAt(call.arguments[2], sizeof(short));
        const bool takes = !kind.empty() && kind[0] != F_UNLCK;
        return takes ? Errors{EACCES, EAGAIN, EINTR, ENOLCK} : Errors{};
    }
    case F_DUPFD:
    case F_DUPFD_CLOEXEC:
        return {EMFILE};
    default:
        return {};
    }
}

} // namespace

std::string nameOf(const SystemCall& call) {
    const Known* const what = lookUp(call);
    return what != nullptr ? what->name : std::to_string(call.number);
}

std::string objectOf(const SystemCall& call) {
    const Known* const what = lookUp(call);
    if (what == nullptr) {
        return {};
    }
    switch (what->about) {
    case About::descriptor:
        return kindOf(call.fileBehind(descriptorOf(call)));
    case About::path:
        return call.pathAt(AT_FDCWD, call.arguments[0]);
    case About::pathAt: {
        // Without a path it is about the descriptor itself.
        const std::string path = call.textAt(call.arguments[1]);
        return path.empty() ? kindOf(call.fileBehind(descriptorOf(call)))
                            : call.pathAt(descriptorOf(call), call.arguments[1]);
    }
    case About::nothing:
        break;
    }
    return {};
}

std::vector<int> errorsOf(const SystemCall& call) {
#ifdef KSTD_SANITIZED
    // What is looked up about the process itself is looked up by the sanitizers.
    if (objectOf(call).starts_with("/proc/")) {
        return {};
    }
#endif
    switch (call.number) {
    case SYS_openat:
        return errorsOfOpening(call.arguments[2]);
#ifdef SYS_open
    case SYS_open:
        return errorsOfOpening(call.arguments[1]);
#endif
    case SYS_read:
        return errorsOfTransfer(call, {EINTR, EIO});
    case SYS_write:
    case SYS_writev:
        return errorsOfTransfer(call, {EDQUOT, EFBIG, EINTR, EIO, ENOSPC, EPERM});
    case SYS_close:
        // What is not yet written fails here at the latest.
        return isOpenForWriting(call) ? Errors{EDQUOT, EINTR, EIO, ENOSPC} : Errors{};
    case SYS_fcntl:
        return errorsOfControl(call);
    case SYS_newfstatat:
        // Without a path it is about an open file.
        return call.textAt(call.arguments[1]).empty() ? Errors{EIO, ENOMEM} : kLookups;
    case SYS_epoll_ctl:
        return call.arguments[1] == EPOLL_CTL_DEL ? Errors{} : Errors{ENOMEM, ENOSPC};
    default:
        const Known* const what = lookUp(call);
        return what != nullptr ? what->errors : Errors{};
    }
}

bool passes(const std::string& call, int error) {
    // A lock that somebody else has, or the system's last one.
    return call == "fcntl" || error == EINTR || error == EAGAIN || error == ECANCELED;
}

} // namespace support
