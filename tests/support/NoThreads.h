#pragma once

#include "base/NotCopied.h"

#include <cstddef>
#include <pthread.h>

namespace support {

/// Threads made while this lasts want more stack than there can be.
class NoThreads : private base::NotCopied {
  public:
    NoThreads() {
        ::pthread_getattr_default_np(&before_);
        pthread_attr_t attributes;
        ::pthread_attr_init(&attributes);
        ::pthread_attr_setstacksize(&attributes, std::size_t{1} << 60);
        ::pthread_setattr_default_np(&attributes);
        ::pthread_attr_destroy(&attributes);
    }
    ~NoThreads() {
        ::pthread_setattr_default_np(&before_);
        ::pthread_attr_destroy(&before_);
    }

  private:
    pthread_attr_t before_{};
};

} // namespace support
