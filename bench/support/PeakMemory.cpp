#include "bench/support/PeakMemory.h"

#include "base/FileDescriptor.h"
#include "bench/support/ProcessStatus.h"
#include "bench/support/SystemError.h"

#include <cstdio>
#include <exception>
#include <fcntl.h>
#include <malloc.h>
#include <stdexcept>
#include <sys/prctl.h>
#include <sys/types.h>
#include <sys/wait.h>
#include <unistd.h>

namespace bench {

namespace {

[[noreturn]] void runCopy(const Work& work, int results) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    try {
        const std::size_t before = memoryOf(::getpid()).resident;
        work();
        const std::size_t risen = memoryOf(::getpid()).peak - before;
        ::_exit(::write(results, &risen, sizeof risen) == sizeof risen ? 0 : 1);
    } catch (const std::exception& error) {
        std::fprintf(stderr, "in the copy whose memory is measured: %s\n", error.what());
        ::_exit(1);
    }
}

} // namespace

std::size_t peakMemoryOf(const Work& work) {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        throw systemError("cannot make a pipe");
    }
    const base::FileDescriptor reading(ends[0]);
    const base::FileDescriptor writing(ends[1]);
    std::fflush(nullptr);
    // Memory that the heap has kept would be used again by the copy and not show as more.
    ::malloc_trim(0);
    const pid_t copy = ::fork();
    if (copy < 0) {
        throw systemError("cannot copy the process");
    }
    if (copy == 0) {
        runCopy(work, writing.get());
    }
    int status = 0;
    std::size_t risen = 0;
    if (::waitpid(copy, &status, 0) != copy || status != 0 ||
        ::read(reading.get(), &risen, sizeof risen) != sizeof risen) {
        throw std::runtime_error("the copy whose memory is measured failed");
    }
    return risen;
}

} // namespace bench
