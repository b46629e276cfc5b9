#include "keystrand/ContextTable.h"

#include "base/Digits.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <sys/random.h>
#include <utility>

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

std::optional<KSTHandle> randomHandle() {
    KSTHandle handle{};
    ssize_t size = 0;
    do {
        size = ::getrandom(handle.bytes, sizeof handle.bytes, 0);
    } while (size < 0 && errno == EINTR);
    if (size != static_cast<ssize_t>(sizeof handle.bytes)) {
        return std::nullopt;
    }
    return handle;
}

bool isNoHandle(const KSTHandle& handle) {
    return std::all_of(std::begin(handle.bytes), std::end(handle.bytes),
                       [](auto byte) { return byte == 0; });
}

std::string toHex(const KSTHandle& handle) {
    return base::hexDigits(handle.bytes);
}

bool HandleOrder::operator()(const KSTHandle& left, const KSTHandle& right) const {
    return std::memcmp(left.bytes, right.bytes, sizeof left.bytes) < 0;
}

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
