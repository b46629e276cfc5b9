#pragma once

#include "common/Allocation.h"

#include <algorithm>
#include <optional>
#include <vector>

namespace support {

/// Stands in the way of the library's allocations for its lifetime: keeps their sizes, refuses one
/// of them when told so, and looks whether memory is all zeros when it is freed.
class ScriptedGate : public kst::AllocationGate {
  public:
    ScriptedGate() : former_(kst::setAllocationGate(this)) {}
    /// Refuses the allocation of this number, counted from 0.
    explicit ScriptedGate(std::size_t refused) : ScriptedGate() { refused_ = refused; }
    ~ScriptedGate() override { kst::setAllocationGate(former_); }

    std::vector<std::size_t> asked;
    std::vector<std::size_t> freed;
    bool everyFreeWasWiped = true;

    bool admits(std::size_t size) override {
        asked.push_back(size);
        return asked.size() - 1 != refused_;
    }

    void aboutToFree(std::span<const std::uint8_t> wiped) override {
        freed.push_back(wiped.size());
        everyFreeWasWiped =
            everyFreeWasWiped &&
            std::all_of(wiped.begin(), wiped.end(), [](std::uint8_t byte) { return byte == 0; });
    }

  private:
    kst::AllocationGate* former_;
    std::optional<std::size_t> refused_;
};

} // namespace support
