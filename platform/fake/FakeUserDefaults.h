#pragma once

#include "platform/UserDefaults.h"

#include <functional>
#include <map>
#include <string>
#include <string_view>

namespace platform {

/// User defaults that a test sets, before anybody on another thread reads them.
class FakeUserDefaults final : public UserDefaults {
  public:
    FakeUserDefaults();
    ~FakeUserDefaults() override;

    [[nodiscard]] ValueMap load(std::string_view domain) override;
    void set(std::string_view domain, std::string_view key, Value value);
    void remove(std::string_view domain, std::string_view key);

  private:
    std::map<std::string, ValueMap, std::less<>> domains_;
};

} // namespace platform
