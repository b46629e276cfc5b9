#pragma once

#include "base/NotCopied.h"
#include "common/Allocation.h"

#include <cstddef>
#include <cstring>
#include <type_traits>

namespace kst {

/// The levels that a walk through a tree is inside of, so that the depth of a tree costs memory of
/// the library's and not the thread's stack. The first kRoomWithoutAllocation cost neither.
template <typename Level>
class LevelStack : private base::NotCopied {
    static_assert(std::is_trivially_copyable_v<Level>);

  public:
    static constexpr std::size_t kRoomWithoutAllocation = 32;

    LevelStack() noexcept : levels_(room_) {}
    ~LevelStack() { releaseAllocated(); }

    /// False, with nothing pushed, when there is no memory.
    [[nodiscard]] bool push(const Level& level) noexcept {
        if (size_ == capacity_ && !grow()) {
            return false;
        }
        levels_[size_++] = level;
        return true;
    }

    /// Keeps the memory.
    void pop() noexcept { --size_; }

    [[nodiscard]] Level& top() noexcept { return levels_[size_ - 1]; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }
    [[nodiscard]] std::size_t size() const noexcept { return size_; }

  private:
    [[nodiscard]] bool grow() noexcept {
        auto* grown = static_cast<Level*>(allocate(2 * capacity_ * sizeof(Level)));
        if (grown == nullptr) {
            return false;
        }
        std::memcpy(grown, levels_, size_ * sizeof(Level));
        releaseAllocated();
        levels_ = grown;
        capacity_ *= 2;
        return true;
    }

    void releaseAllocated() noexcept {
        if (levels_ != room_) {
            release(levels_, capacity_ * sizeof(Level));
        }
    }

    Level room_[kRoomWithoutAllocation];
    Level* levels_;
    std::size_t capacity_ = kRoomWithoutAllocation;
    std::size_t size_ = 0;
};

} // namespace kst
