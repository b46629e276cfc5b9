#include "KSTLib/TemporaryContext.h"

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Platform.h"

namespace kst {

TemporaryContext::~TemporaryContext() {
    if (context_ == nullptr) {
        return;
    }
    KSTStatus err = kKSTErrorUnexpected;
    if (process_ == processNumber()) {
        err = isTimeUp() ? postContextDelete(context_) : deleteContext(context_, true);
    }
    if (err != kKSTErrorSuccess) {
        static_cast<void>(deleteContext(context_, false));
    }
}

KSTStatus TemporaryContext::create(CheckPlace place) noexcept {
    process_ = processNumber();
    const KSTStatus err = createContext(&context_);
    return err == kKSTErrorSuccess ? err : failCall(libraryContext(), err, place);
}

} // namespace kst
