#pragma once

/// What a mutated source asks. Included before everything else in the build of the mutants.

extern "C" unsigned mutantSwitchedOn;
extern "C" unsigned char* mutantsReached;

/// Whether the mutant is the one that is switched on; notes that it was reached. A value that the
/// compiler needs stays what it is.
constexpr bool mutant(unsigned number) noexcept {
    if (__builtin_is_constant_evaluated()) {
        return false;
    }
    mutantsReached[number] = 1;
    return number == mutantSwitchedOn;
}

/// The next value of the same type.
template <typename Value>
constexpr Value nextValue(Value value) noexcept {
    if constexpr (__is_enum(Value)) {
        return static_cast<Value>(static_cast<long long>(value) + 1);
    } else if constexpr (__is_same(Value, bool)) {
        return !value;
    } else {
        return static_cast<Value>(value + 1);
    }
}
