#include "common/CredentialCommands.h"

#include "KSTLib/Command.h"
#include "KSTLib/CredentialSerialization.h"
#include "common/Allocation.h"
#include "common/BuiltPayload.h"
#include "common/ContextObject.h"
#include "common/HandleWire.h"

namespace kst {

const CredentialCommand kAddCredential = {kKSTCommandAddCredential, GetSerializedAddCredentialSize,
                                          SerializeAddCredential};

const CredentialCommand kRemoveCredential = {kKSTCommandRemoveCredentialsByValue,
                                             GetSerializedRemoveCredentialSize,
                                             SerializeRemoveCredential};

const CredentialCommand kReplacePassphrase = {kKSTCommandReplacePassphraseCredentials,
                                              GetSerializedReplacePassphraseCredentialSize,
                                              SerializeReplacePassphraseCredential};

KSTStatus checkScope(const AssertionContext& report, KSTContextRef context,
                     KSTScope scope) noexcept {
    return context != nullptr || scope == kKSTScopeGlobal
               ? kKSTErrorSuccess
               : fail(report, "context || scope == kKSTScopeGlobal", 0, kKSTErrorBadParameter);
}

KSTStatus checkCredential(const AssertionContext& report, KSTContextRef context,
                          const KSTCredential* credential, KSTScope scope) noexcept {
    const KSTStatus err = checkScope(report, context, scope);
    if (err == kKSTErrorSuccess && credential == nullptr) {
        return fail(report, "credential", 0, kKSTErrorBadParameter);
    }
    return err;
}

KSTStatus sendCredential(const CommandSender& sender, const CredentialCommand& command,
                         KSTContextRef context, const KSTCredential* credential,
                         KSTScope scope) noexcept {
    const KSTHandle* handle = handleOf(context);
    BuiltPayload payload;
    const KSTStatus err = payload.build<std::size_t>(
        sender.context,
        [&](std::size_t* size) { return command.getSize(handle, credential, scope, size); },
        [&](void* buffer, std::size_t* size) {
            return command.serialize(handle, credential, scope, buffer, size);
        });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return sender.send(command.code, payload.bytes(), payload.size(), nullptr, nullptr);
}

KSTStatus sendNumbers(const CommandSender& sender, std::uint32_t code, KSTContextRef context,
                      std::uint32_t first, std::uint32_t second, void* outData,
                      std::size_t* outSize) noexcept {
    const AllocatedMemory inputBuffer(kKSTHandleSize + sizeof first + sizeof second);
    if (inputBuffer.bytes() == nullptr) {
        return fail(sender.context, "inputBuffer", 0, kKSTErrorOutOfMemory);
    }
    base::ByteWriter writer(inputBuffer.bytes(), inputBuffer.size());
    static_cast<void>(writeHandle(writer, handleOf(context)) && writer.writeU32(first) &&
                      writer.writeU32(second));
    return sender.send(code, inputBuffer.bytes(), inputBuffer.size(), outData, outSize);
}

} // namespace kst
