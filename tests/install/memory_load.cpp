// memory_load LIBRARY: loads the library with each allocation of loading it failing, once and from
// there on. What the loader cannot do without memory is its own affair; a library that was loaded
// works.

#include "KSTLib/KSTLib.h"
#include "failing_malloc.h"

#include <cstdio>
#include <dlfcn.h>
#include <utility>

namespace {

/// How a try ended; 3 is a process that did not end by itself. 127 is the system's loader, which
/// ends the program where it cannot go back any more.
enum Ended : int {
    notLoaded = 0,
    nothingLeftToFail = 1,
    broken = 2,
    loaded = 4,
    loaderEnded = 127
};

int tryOnce(const char* library, std::size_t failing, bool fromThereOn) {
    orders = {true, fromThereOn, failing, 0, 0, 0};
    void* const handle = ::dlopen(library, RTLD_NOW | RTLD_LOCAL);
    const Orders after = std::exchange(orders, Orders{});
    if (handle == nullptr) {
        return after.failed > 0 ? notLoaded : broken;
    }
    const auto control =
        reinterpret_cast<decltype(&KSTKernelControl)>(::dlsym(handle, "KSTKernelControl"));
    if (control == nullptr || control(5, "\1", 1, {}) != 0) {
        return broken;
    }
    return after.failed == 0 ? nothingLeftToFail : loaded;
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        return 2;
    }
    for (const bool fromThereOn : {false, true}) {
        std::size_t failing = 0;
        int ended = notLoaded;
        while (ended == notLoaded || ended == loaded || ended == loaderEnded) {
            ended = inChild([&] { ::_exit(tryOnce(argv[1], failing, fromThereOn)); });
            ++failing;
        }
        if (ended != nothingLeftToFail) {
            std::fprintf(stderr, "not ok - loading, allocation %zu: %d\n", failing - 1, ended);
            return 1;
        }
        std::fprintf(stderr, "%zu allocations in loading\n", failing - 1);
    }
    return 0;
}
