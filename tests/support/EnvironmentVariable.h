#pragma once

#include "base/NotCopied.h"

#include <stdlib.h>
#include <string>
#include <utility>

namespace support {

/// A variable of the environment that is set for a while, and then not set at all.
class EnvironmentVariable : private base::NotCopied {
  public:
    EnvironmentVariable(std::string name, const std::string& value) : name_(std::move(name)) {
        ::setenv(name_.c_str(), value.c_str(), 1);
    }
    ~EnvironmentVariable() { ::unsetenv(name_.c_str()); }

  private:
    std::string name_;
};

} // namespace support
