#include "keystrand/ContextTable.h"

#include <utility>

namespace keystrand {

namespace {

/// Of random handles the first one is free.
constexpr int kMaxDraws = 4;

} // namespace

ContextTable::ContextTable(HandleSource handles) : handles_(std::move(handles)) {}

std::optional<KSTHandle> ContextTable::create() {
    if (contexts_.size() == kMaxCount) {
        return std::nullopt;
    }
    for (int draw = 0; draw < kMaxDraws; ++draw) {
        const auto handle = handles_();
        if (!handle) {
            return std::nullopt;
        }
        if (!isNoHandle(*handle) && contexts_.try_emplace(*handle).second) {
            return handle;
        }
    }
    return std::nullopt;
}

bool ContextTable::destroy(const KSTHandle& handle) {
    return contexts_.erase(handle) == 1;
}

Context* ContextTable::find(const KSTHandle& handle) {
    const auto found = contexts_.find(handle);
    return found == contexts_.end() ? nullptr : &found->second;
}

} // namespace keystrand
