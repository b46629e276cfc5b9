#ifndef KST_KSTLIB_BLOCKS_H
#define KST_KSTLIB_BLOCKS_H

#include "KSTLib/Public.h"
#include "KSTLib/Status.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
#include <memory>
#include <type_traits>
#include <utility>

namespace kst {

template <typename Signature>
struct BlockOf;

/// What C++ adds to a result block: it can be made from nullptr and from any callable.
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
    BlockOf(Callable&& callable KST_LIFETIMEBOUND) noexcept : BlockOf() {
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
    template <typename Target, typename = void>
    struct IsComparedWithNull : std::false_type {};

    template <typename Target>
    struct IsComparedWithNull<Target,
                              std::void_t<decltype(std::declval<const Target&>() == nullptr)>>
        : std::is_convertible<decltype(std::declval<const Target&>() == nullptr), bool> {};

    template <typename Target>
    static bool isNull(const Target& target) noexcept {
        // A lambda without captures compares with nullptr too, and is never null.
        constexpr bool kCanBeNull =
            std::is_constructible_v<Target, decltype(nullptr)> && IsComparedWithNull<Target>::value;
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

typedef struct KSTRequirement KSTRequirement;

/** Result blocks: what a library function calls to hand over what it found.
 *
 *  A block is called synchronously, on the caller's thread, before the function returns. What it is
 *  handed is valid only during the call: copy what is to be kept. `data` is null when `length`
 *  is 0.
 *
 *  Each is a struct of two words, the same in C and in C++, and is passed by value:
 *
 *      void (*invoke)(void* captured, <what the block is handed>);
 *      void* captured;
 *
 *  A block whose `invoke` is null is a null block. Of the functions only those that say so do
 *  without a block; KST_NO_BLOCK says so in a call.
 *
 *  C fills in both members. C++ may instead pass nullptr or anything that can be called with what
 *  the block is handed. The callable is held by its address and must live until the library
 *  function has returned, which an argument written in the call does; clang warns of a block that
 *  is stored without its callable. An exception that leaves it ends the program. A null function
 * pointer and an empty std::function give a null block. */

#ifdef __cplusplus
#define KST_BLOCK(name, ...)                                                                       \
    struct name : kst::BlockOf<void(__VA_ARGS__)> {                                                \
        using kst::BlockOf<void(__VA_ARGS__)>::BlockOf;                                            \
    };                                                                                             \
    static_assert(kst::kIsTwoWords<name>)
#else
#define KST_BLOCK(name, ...)                                                                       \
    typedef struct name {                                                                          \
        void (*invoke)(void* captured, __VA_ARGS__);                                               \
        void* captured;                                                                            \
    } name
#endif

/** No block, for a function that does without: a null KSTDataBlock, in C++ any null block. */
#ifdef __cplusplus
#define KST_NO_BLOCK nullptr
#else
#define KST_NO_BLOCK ((KSTDataBlock){NULL, NULL})
#endif

/** Gets `length` bytes at `data`. The library wipes them after the call unless they belong to an
 *  object of the caller. */
KST_BLOCK(KSTDataBlock, const void* data, size_t length);

/** Gets one property: its number and its `length` bytes at `data`. */
KST_BLOCK(KSTPropertyBlock, uint32_t propertyId, const void* data, size_t length);

/** Gets one requirement, which is not the block's to free; null for an empty place in a tree that
 *  the caller put together. */
KST_BLOCK(KSTRequirementBlock, const KSTRequirement* requirement);

/** Gets how the call ended, and `length` bytes at `data`, which are wiped after it. */
KST_BLOCK(KSTStatusDataBlock, KSTStatus status, const void* data, size_t length);

/** Gets whether a policy is satisfied, and the requirement tree that came with the answer, or null.
 *  The tree is not the block's to free. */
KST_BLOCK(KSTPolicyBlock, bool policySatisfied, const KSTRequirement* requirement);

/** Gets how the call ended and then what KSTPolicyBlock gets: false and null unless the status
 *  is 0. */
KST_BLOCK(KSTPolicyStatusBlock, KSTStatus status, bool policySatisfied,
          const KSTRequirement* requirement);

#endif
