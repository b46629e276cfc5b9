// Loaded before a client: says how many places of the client's memory hold a secret, which it is
// told with its bits turned round (TURNED_SECRET, 32 hexadecimal digits), each time that the client
// asks about a policy and at its end. A thread looks, so that what the client has left on its stack
// is not written over.

#include "KSTLib/PolicyVerification.h"
#include "tests/support/MemoryScan.h"

#include <cstdlib>
#include <dlfcn.h>
#include <memory>
#include <semaphore.h>
#include <thread>

namespace {

using Verify = decltype(&KSTContextVerifyPolicyEx);

std::unique_ptr<support::MemoryScan> scan;
Verify verify = nullptr;
sem_t wanted;
sem_t done;

void work() {
    for (;;) {
        ::sem_wait(&wanted);
        std::fprintf(stderr, "places %zu\n", scan->places());
        ::sem_post(&done);
    }
}

__attribute__((constructor)) void prepare() {
    verify = reinterpret_cast<Verify>(::dlsym(RTLD_NEXT, "KSTContextVerifyPolicyEx"));
    const char* digits = std::getenv("TURNED_SECRET");
    if (digits == nullptr || std::strlen(digits) != 2 * support::MemoryScan::kSecretSize) {
        return;
    }
    support::MemoryScan::Turned turned{};
    for (std::size_t i = 0; i < turned.size(); ++i) {
        const char pair[] = {digits[2 * i], digits[2 * i + 1], '\0'};
        turned[i] = static_cast<std::uint8_t>(std::strtoul(pair, nullptr, 16));
    }
    scan = std::make_unique<support::MemoryScan>(turned);
    ::sem_init(&wanted, 0, 0);
    ::sem_init(&done, 0, 0);
    std::thread(work).detach();
}

__attribute__((destructor)) void look() {
    if (scan != nullptr) {
        ::sem_post(&wanted);
        ::sem_wait(&done);
    }
}

} // namespace

void KSTContextVerifyPolicyEx(KSTContextRef context, const char* policyId, bool preflight,
                              const KSTParameter* parameters, uint32_t parametersCount,
                              uint32_t maxGlobalCredentialAge,
                              KSTPolicyStatusBlock processRequirement) noexcept {
    look();
    verify(context, policyId, preflight, parameters, parametersCount, maxGlobalCredentialAge,
           processRequirement);
}
