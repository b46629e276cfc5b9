#ifndef KST_COMMON_BLOCKS_H
#define KST_COMMON_BLOCKS_H

#include <stddef.h>

#ifdef __cplusplus
#include <concepts>
#include <memory>
#include <type_traits>
#endif

/** What a library function calls to hand over `length` bytes at `data`.
 *
 *  Called synchronously, on the caller's thread, before the function returns. The bytes are valid
 *  only during the call and are wiped after it: copy what is to be kept. `data` is null when
 *  `length` is 0.
 *
 *  A block whose `invoke` is null is a null block.
 *
 *  C fills in both members. C++ may instead pass nullptr or anything that can be called with
 *  (const void* data, size_t length). The callable is held by its address and must live until the
 *  library function has returned, which an argument written in the call does; an exception that
 *  leaves it ends the program. A null function pointer and an empty std::function give a null
 *  block. The struct is the same two words in both languages and is passed by value. */
typedef struct KSTDataBlock {
    void (*invoke)(void* captured, const void* data, size_t length);
    void* captured;

#ifdef __cplusplus
    KSTDataBlock() noexcept : KSTDataBlock(nullptr, nullptr) {}

    KSTDataBlock(decltype(nullptr)) noexcept : KSTDataBlock() {}

    KSTDataBlock(void (*function)(void* captured, const void* data, size_t length),
                 void* capturedByFunction) noexcept
        : invoke(function), captured(capturedByFunction) {}

    template <typename Callable, typename = std::enable_if_t<
                                     !std::is_same_v<std::remove_cvref_t<Callable>, KSTDataBlock> &&
                                     std::is_invocable_v<Callable&, const void*, size_t>>>
    KSTDataBlock(Callable&& callable) noexcept : KSTDataBlock() {
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
    static void callObject(void* captured, const void* data, size_t length) noexcept {
        static_cast<void>((*static_cast<Target*>(captured))(data, length));
    }

    template <typename Target>
    static void callFunction(void* captured, const void* data, size_t length) noexcept {
        static_cast<void>(reinterpret_cast<Target*>(captured)(data, length));
    }
#endif
} KSTDataBlock;

#ifdef __cplusplus
static_assert(sizeof(KSTDataBlock) == 2 * sizeof(void*));
static_assert(std::is_trivially_copyable_v<KSTDataBlock>);
static_assert(std::is_trivially_destructible_v<KSTDataBlock>);
static_assert(std::is_standard_layout_v<KSTDataBlock>);
#endif

#endif
