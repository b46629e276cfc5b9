#pragma once

#include "KSTLib/LibCall.h"
#include "common/AssertLine.h"

#include <cstddef>
#include <cstdint>

namespace kst {

/// How a family of functions sends its commands and reports what fails: the library over its own
/// channel, or a LibCall function over its caller's transport.
struct CommandSender {
    AssertionContext context;
    /// Not null.
    KSTTransport transport;

    /// Sends one command with third byte 0 and a null transport context. A failure is reported and
    /// returned.
    [[nodiscard]] KSTStatus send(std::uint32_t code, const void* inData, std::size_t inSize,
                                 void* outData, std::size_t* outSize,
                                 CheckPlace place = CheckPlace::here()) const {
        const KSTStatus err = transport(nullptr, code, 0, inData, inSize, outData, outSize);
        return err == kKSTErrorSuccess ? err : failCall(context, err, place);
    }
};

} // namespace kst
