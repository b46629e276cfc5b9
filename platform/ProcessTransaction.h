#pragma once

#include "base/NotCopied.h"

#include <string_view>

namespace platform {

/// Keeps count of what the process has in hand. While the count is not zero the process is not
/// ended for being idle. Called on the main thread only.
class ProcessTransactions : private base::NotCopied {
  public:
    virtual ~ProcessTransactions() = default;

    virtual void begin(std::string_view label) = 0;
    virtual void end(std::string_view label) = 0;
};

/// One thing in hand, from construction to destruction. The label must outlive it.
class ProcessTransaction : private base::NotCopied {
  public:
    ProcessTransaction(ProcessTransactions& transactions, std::string_view label)
        : transactions_(transactions), label_(label) {
        transactions_.begin(label_);
    }
    ~ProcessTransaction() { transactions_.end(label_); }

  private:
    ProcessTransactions& transactions_;
    std::string_view label_;
};

} // namespace platform
