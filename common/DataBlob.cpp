#include "KSTLib/Serialization.h"
#include "common/Allocation.h"

void DeallocDataBlob(void* data, std::size_t length) noexcept {
    kst::release(data, length);
}
