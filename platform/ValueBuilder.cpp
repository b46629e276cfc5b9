#include "platform/ValueBuilder.h"

namespace platform {

void ValueBuilder::closeInnermost() {
    Open innermost = std::move(open_.back());
    open_.pop_back();
    std::visit([this](auto& content) { add(std::move(content)); }, innermost.content);
}

void ValueBuilder::add(Value value) {
    if (open_.empty()) {
        value_ = std::move(value);
    } else if (auto* map = std::get_if<ValueMap>(&open_.back().content)) {
        map->insert_or_assign(std::move(open_.back().key), std::move(value));
    } else {
        std::get<ValueList>(open_.back().content).push_back(std::move(value));
    }
}

} // namespace platform
