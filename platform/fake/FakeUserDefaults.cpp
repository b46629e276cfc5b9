#include "platform/fake/FakeUserDefaults.h"

namespace platform {

FakeUserDefaults::FakeUserDefaults() = default;
FakeUserDefaults::~FakeUserDefaults() = default;

std::optional<Value> FakeUserDefaults::value(std::string_view domain, std::string_view key) {
    const auto entry = values_.find({std::string(domain), std::string(key)});
    return entry == values_.end() ? std::nullopt : std::optional(entry->second);
}

void FakeUserDefaults::set(std::string_view domain, std::string_view key, Value value) {
    values_.insert_or_assign({std::string(domain), std::string(key)}, std::move(value));
}

void FakeUserDefaults::remove(std::string_view domain, std::string_view key) {
    values_.erase({std::string(domain), std::string(key)});
}

} // namespace platform
