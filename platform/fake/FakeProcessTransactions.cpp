#include "platform/fake/FakeProcessTransactions.h"

#include "base/Concat.h"
#include "platform/fake/TestError.h"

#include <algorithm>

namespace platform {

void FakeProcessTransactions::begin(std::string_view label) {
    open_.emplace_back(label);
    begun_.emplace_back(label);
}

void FakeProcessTransactions::end(std::string_view label) {
    const auto found = std::find(open_.begin(), open_.end(), label);
    if (found == open_.end()) {
        testError(base::concat("the transaction \"", label, "\" was ended and never begun"));
    }
    open_.erase(found);
}

} // namespace platform
