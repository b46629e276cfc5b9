#include "KSTLib/TemporaryContext.h"

#include "KSTLib/Contexts.h"
#include "KSTLib/LibraryLogging.h"

namespace kst {

TemporaryContext::~TemporaryContext() {
    if (context_ != nullptr && KSTContextDelete(context_, true) != kKSTErrorSuccess) {
        static_cast<void>(KSTContextDelete(context_, false));
    }
}

KSTStatus TemporaryContext::create(CheckPlace place) noexcept {
    const KSTStatus err = KSTContextCreate(&context_);
    return err == kKSTErrorSuccess ? err : failCall(libraryContext(), err, place);
}

} // namespace kst
