#pragma once

#include "platform/UserDefaults.h"

#include <map>
#include <string>
#include <utility>

namespace platform {

/// User defaults that a test sets, before anybody on another thread reads them.
class FakeUserDefaults final : public UserDefaults {
  public:
    [[nodiscard]] std::optional<Value> value(std::string_view domain,
                                             std::string_view key) override {
        const auto entry = values_.find({std::string(domain), std::string(key)});
        return entry == values_.end() ? std::nullopt : std::optional(entry->second);
    }

    void set(std::string_view domain, std::string_view key, Value value) {
        values_.insert_or_assign({std::string(domain), std::string(key)}, std::move(value));
    }

    void remove(std::string_view domain, std::string_view key) {
        values_.erase({std::string(domain), std::string(key)});
    }

  private:
    /// By domain and key.
    std::map<std::pair<std::string, std::string>, Value> values_;
};

} // namespace platform
