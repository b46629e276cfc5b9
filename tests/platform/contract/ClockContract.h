#pragma once

#include "base/NotCopied.h"
#include "platform/Clock.h"
#include "tests/platform/contract/ContractTest.h"

namespace contract {

struct ClockFixture : private base::NotCopied {
    virtual ~ClockFixture() = default;

    virtual platform::Clock& clock() = 0;

    /// What the clock shows, found in another way.
    virtual platform::Date reference() = 0;
};

class ClockContract : public ContractTest<ClockFixture> {
  protected:
    [[nodiscard]] platform::Clock& clock() { return fixture().clock(); }
};

} // namespace contract
