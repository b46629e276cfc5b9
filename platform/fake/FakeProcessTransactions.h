#pragma once

#include "platform/ProcessTransaction.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

/// Transactions that are counted and remembered. Ending one that was not begun is an error in the
/// test or in what it tests.
class FakeProcessTransactions final : public ProcessTransactions {
  public:
    void begin(std::string_view label) override;
    void end(std::string_view label) override;

    [[nodiscard]] std::size_t count() const { return open_.size(); }

    /// The labels of those that have begun and not ended, in the order of their beginning.
    [[nodiscard]] const std::vector<std::string>& open() const { return open_; }

    /// The labels of all that ever began.
    [[nodiscard]] const std::vector<std::string>& begun() const { return begun_; }

  private:
    std::vector<std::string> open_;
    std::vector<std::string> begun_;
};

} // namespace platform
