#pragma once

namespace base {

/// The base, a private one, of what is never copied. A class with a move of its own does without
/// it: that has no copies anyway.
class NotCopied {
  public:
    NotCopied(const NotCopied&) = delete;
    NotCopied& operator=(const NotCopied&) = delete;

  protected:
    NotCopied() = default;
    ~NotCopied() = default;
};

} // namespace base
