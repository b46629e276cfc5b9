#include "platform/fake/FakeKernel.h"

#include <utility>

namespace platform {

FakeStructAnswer FakeKernel::answer(const FakeStructCall& call) {
    structCalls.push_back(call);
    if (structAnswers.empty()) {
        return onStructCall ? onStructCall(call) : FakeStructAnswer();
    }
    FakeStructAnswer answer = std::move(structAnswers.front());
    structAnswers.pop_front();
    return answer;
}

FakeScalarAnswer FakeKernel::answer(const FakeScalarCall& call) {
    scalarCalls.push_back(call);
    if (scalarAnswers.empty()) {
        return {};
    }
    FakeScalarAnswer answer = std::move(scalarAnswers.front());
    scalarAnswers.pop_front();
    return answer;
}

} // namespace platform
