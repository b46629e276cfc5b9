#pragma once

#include "platform/UserDefaults.h"

#include <map>
#include <string>
#include <utility>

namespace platform {

/// User defaults that a test sets, before anybody on another thread reads them.
class FakeUserDefaults final : public UserDefaults {
  public:
    FakeUserDefaults();
    ~FakeUserDefaults() override;

    [[nodiscard]] std::optional<Value> value(std::string_view domain,
                                             std::string_view key) override;
    void set(std::string_view domain, std::string_view key, Value value);
    void remove(std::string_view domain, std::string_view key);

  private:
    /// By domain and key.
    std::map<std::pair<std::string, std::string>, Value> values_;
};

} // namespace platform
