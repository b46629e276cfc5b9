#include "common/PayloadReader.h"

#include "common/HandleWire.h"

namespace kst {

KSTStatus PayloadReader::readHandle() noexcept {
    return kst::readHandle(rest_, *outputs_.handle)
               ? kKSTErrorSuccess
               : fail(serializationContext(), "(size - offset) >= sizeof(KSTHandle)", 0,
                      kKSTErrorBadParameter);
}

KSTStatus PayloadReader::readFlag(std::uint8_t& flag) noexcept {
    std::uint8_t byte = 0;
    if (!rest_.readU8(byte)) {
        return fail(serializationContext(), "(size - offset) >= sizeof(uint8_t)", 0,
                    kKSTErrorBadParameter);
    }
    flag = byte != 0 ? 1 : 0;
    return kKSTErrorSuccess;
}

KSTStatus PayloadReader::finish() noexcept {
    const KSTStatus err = parameters_.read(rest_);
    if (err == kKSTErrorSuccess) {
        parameters_.handOut(*outputs_.maxGlobalCredentialAge, *outputs_.parameters,
                            *outputs_.parametersCount);
    }
    return err;
}

} // namespace kst
