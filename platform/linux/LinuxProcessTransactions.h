#pragma once

#include "platform/ProcessTransaction.h"

namespace platform {

/// The count of transactions of this process.
class LinuxProcessTransactions final : public ProcessTransactions {
  public:
    void begin(std::string_view label) override;
    void end(std::string_view label) override;

    [[nodiscard]] bool busy() const { return count_ > 0; }

  private:
    int count_ = 0;
};

} // namespace platform
