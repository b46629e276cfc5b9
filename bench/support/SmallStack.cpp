#include "bench/support/SmallStack.h"

#include <exception>
#include <pthread.h>
#include <system_error>

namespace bench {

namespace {

struct Run {
    const std::function<void()>& work;
    std::exception_ptr thrown;
};

void* runOnThread(void* argument) {
    auto& run = *static_cast<Run*>(argument);
    try {
        run.work();
    } catch (...) {
        run.thrown = std::current_exception();
    }
    return nullptr;
}

} // namespace

void runOnStackOf(std::size_t size, const std::function<void()>& work) {
    Run run{work, nullptr};
    pthread_attr_t attributes;
    pthread_t thread{};
    ::pthread_attr_init(&attributes);
    int problem = ::pthread_attr_setstacksize(&attributes, size);
    if (problem == 0) {
        problem = ::pthread_create(&thread, &attributes, runOnThread, &run);
    }
    ::pthread_attr_destroy(&attributes);
    if (problem != 0) {
        throw std::system_error(problem, std::generic_category(), "cannot start a thread");
    }
    ::pthread_join(thread, nullptr);
    if (run.thrown) {
        std::rethrow_exception(run.thrown);
    }
}

} // namespace bench
