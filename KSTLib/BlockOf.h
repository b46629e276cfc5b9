#ifndef KST_KSTLIB_BLOCK_OF_H
#define KST_KSTLIB_BLOCK_OF_H

#ifdef __cplusplus

#include <concepts>
#include <memory>
#include <type_traits>

namespace kst {

template <typename Signature>
struct BlockOf;

/// What C++ adds to a result block (KSTLib/Blocks.h): it can be made from nullptr and from any
/// callable.
template <typename... Arguments>
struct BlockOf<void(Arguments...)> {
    void (*invoke)(void* captured, Arguments... arguments);
    void* captured;

    BlockOf() noexcept : BlockOf(nullptr, nullptr) {}

    BlockOf(decltype(nullptr)) noexcept : BlockOf() {}

    BlockOf(void (*function)(void* captured, Arguments... arguments),
            void* capturedByFunction) noexcept
        : invoke(function), captured(capturedByFunction) {}

    template <typename Callable,
              typename = std::enable_if_t<std::is_invocable_v<Callable&, Arguments...>>>
    BlockOf(Callable&& callable) noexcept : BlockOf() {
        using Target = std::remove_reference_t<Callable>;
        if constexpr (std::is_function_v<Target>) {
            invoke = callFunction<Target>;
            captured = reinterpret_cast<void*>(&callable);
        } else if (!isNull(callable)) {
            invoke = callObject<Target>;
            captured = const_cast<void*>(static_cast<const void*>(std::addressof(callable)));
        }
    }

  private:
    template <typename Target>
    static bool isNull(const Target& target) noexcept {
        // A lambda without captures compares with nullptr too, and is never null.
        constexpr bool kCanBeNull = std::is_constructible_v<Target, decltype(nullptr)> && requires {
            { target == nullptr } -> std::convertible_to<bool>;
        };
        if constexpr (kCanBeNull) {
            return target == nullptr;
        } else {
            return false;
        }
    }

    template <typename Target>
    static void callObject(void* captured, Arguments... arguments) noexcept {
        static_cast<void>((*static_cast<Target*>(captured))(arguments...));
    }

    template <typename Target>
    static void callFunction(void* captured, Arguments... arguments) noexcept {
        static_cast<void>(reinterpret_cast<Target*>(captured)(arguments...));
    }
};

/// Whether C and C++ agree on a block.
template <typename Block>
inline constexpr bool
    kIsTwoWords = sizeof(Block) == 2 * sizeof(void*) &&
                  std::is_trivially_copyable_v<Block>&& std::is_trivially_destructible_v<
                      Block>&& std::is_standard_layout_v<Block>;

} // namespace kst

#endif

#endif
