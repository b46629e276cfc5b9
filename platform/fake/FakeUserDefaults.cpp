#include "platform/fake/FakeUserDefaults.h"

#include <utility>

namespace platform {

FakeUserDefaults::FakeUserDefaults() = default;
FakeUserDefaults::~FakeUserDefaults() = default;

ValueMap FakeUserDefaults::load(std::string_view domain) {
    const auto found = domains_.find(domain);
    return found != domains_.end() ? found->second : ValueMap();
}

void FakeUserDefaults::set(std::string_view domain, std::string_view key, Value value) {
    domains_[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
}

void FakeUserDefaults::remove(std::string_view domain, std::string_view key) {
    domains_[std::string(domain)].erase(std::string(key));
}

} // namespace platform
