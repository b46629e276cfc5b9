#pragma once

#include "base/NotCopied.h"
#include "tests/support/ScriptedTransport.h"

#include <optional>

namespace support {

/// A scripted transport for the functions that hand over a null context: one at a time.
class ContextlessTransport : public ScriptedTransport, private base::NotCopied {
  public:
    ContextlessTransport() { current = this; }
    ~ContextlessTransport() { current = nullptr; }

    /// Whether every context that was handed over was null.
    bool contextWasNull = true;

    static KSTStatus answer(void* context, std::uint32_t code, std::uint32_t thirdByte,
                            const void* inData, std::size_t inSize, void* outData,
                            std::size_t* outSize) {
        current->contextWasNull = current->contextWasNull && context == nullptr;
        return function(current, code, thirdByte, inData, inSize, outData, outSize);
    }

    /// Replies with `bytes`, all of them.
    void replyWith(const std::vector<std::uint8_t>& bytes) {
        reply = bytes;
        reportedSize = bytes.size();
    }

  private:
    static inline ContextlessTransport* current = nullptr;
};

} // namespace support
