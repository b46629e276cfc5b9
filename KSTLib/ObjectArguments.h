#pragma once

#include "KSTLib/Blocks.h"
#include "KSTLib/LibraryLogging.h"
#include "common/AssertLine.h"
#include "common/RequiredFunction.h"

#include <cstddef>
#include <cstdint>

/// What the functions that hand parts of a caller's object to a block have in common.
namespace kst {

/// An object and a block under the names that the lines of failed checks give them.
template <typename Block>
[[nodiscard]] KSTStatus requireObjectAndBlock(const Argument& object, const Block& block,
                                              const char* blockName) noexcept {
    const KSTStatus err = libraryContext().requireArguments({object});
    return err == kKSTErrorSuccess ? requireBlock(libraryContext(), block, blockName) : err;
}

/// Hands over what `getPropertyData` finds; a null pointer for no bytes.
template <typename Object>
[[nodiscard]] KSTStatus handOverProperty(const Object* object, const char* objectName,
                                         std::uint32_t propertyId,
                                         KSTStatus (*getPropertyData)(const Object*, std::uint32_t,
                                                                      const void**, std::size_t*),
                                         const KSTDataBlock& processProperty) noexcept {
    KSTStatus err =
        requireObjectAndBlock(Argument(object, objectName), processProperty, "processProperty");
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const void* data = nullptr;
    std::size_t length = 0;
    err = getPropertyData(object, propertyId, &data, &length);
    if (err != kKSTErrorSuccess) {
        return failCall(libraryContext(), err);
    }
    processProperty.invoke(processProperty.captured, length > 0 ? data : nullptr, length);
    return kKSTErrorSuccess;
}

} // namespace kst
