#pragma once

#include "base/NotCopied.h"
#include "platform/SystemLog.h"
#include "tests/platform/contract/ContractTest.h"

#include <string>
#include <vector>

namespace contract {

/// A log, and a look at the lines that it has written.
struct SystemLogFixture : private base::NotCopied {
    virtual ~SystemLogFixture() = default;

    virtual platform::SystemLog& log() = 0;
    [[nodiscard]] virtual std::vector<std::string> lines() = 0;
};

class SystemLogContract : public ContractTest<SystemLogFixture> {
  protected:
    void write(std::string_view text) { fixture().log().write(platform::LogLevel::info, text, {}); }
};

} // namespace contract
