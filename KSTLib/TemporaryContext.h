#pragma once

#include "KSTLib/Contexts.h"
#include "KSTLib/Status.h"
#include "common/AssertLine.h"

namespace kst {

/// A context that is made for one call on the global scope and destroyed at the end of the scope.
/// When the kernel service cannot be told, the object goes alone.
class TemporaryContext {
  public:
    TemporaryContext() = default;
    TemporaryContext(const TemporaryContext&) = delete;
    TemporaryContext& operator=(const TemporaryContext&) = delete;
    ~TemporaryContext();

    /// What KSTContextCreate fails with, reported by the caller's line too. To be called once.
    [[nodiscard]] KSTStatus create(CheckPlace place = CheckPlace::here()) noexcept;

    [[nodiscard]] KSTContextRef get() const { return context_; }

  private:
    KSTContextRef context_ = nullptr;
};

} // namespace kst
