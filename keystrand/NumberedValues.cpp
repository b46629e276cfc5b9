#include "keystrand/NumberedValues.h"

namespace keystrand {

bool NumberedValues::set(std::uint32_t id, std::span<const std::uint8_t> value) {
    if (value.size() > kMaxValueSize) {
        return false;
    }
    if (value.empty()) {
        values_.erase(id);
        return true;
    }
    if (values_.size() == kMaxCount && !values_.contains(id)) {
        return false;
    }
    values_[id].assign(value.begin(), value.end());
    return true;
}

std::span<const std::uint8_t> NumberedValues::get(std::uint32_t id) const {
    const auto found = values_.find(id);
    if (found == values_.end()) {
        return {};
    }
    return found->second;
}

} // namespace keystrand
