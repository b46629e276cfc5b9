#include "KSTLib/CredentialSerialization.h"
#include "common/ContextObject.h"
#include "common/Failure.h"

namespace {

using kst::serializationContext;

constexpr std::size_t kSmallestSize = kKSTHandleSize + sizeof(KSTCredential) + sizeof(KSTScope);
static_assert(kSmallestSize == 52);

KSTStatus checkScope(const KSTHandle* handle, KSTScope scope) {
    return handle != nullptr || scope == kKSTScopeGlobal
               ? kKSTErrorSuccess
               : kst::fail(serializationContext(), "handle || scope == kKSTScopeGlobal", 0,
                           kKSTErrorBadParameter);
}

/// What the functions that are the Add functions under another name return.
KSTStatus passUp(KSTStatus err, kst::CheckPlace place = kst::CheckPlace::here()) {
    return err == kKSTErrorSuccess ? err : kst::failCall(serializationContext(), err, place);
}

} // namespace

KSTStatus GetSerializedAddCredentialSize(const KSTHandle* handle, const KSTCredential* credential,
                                         KSTScope scope, std::size_t* outSize) noexcept {
    KSTStatus err = checkScope(handle, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(serializationContext(), {
                                                            kst::Argument(credential, "credential"),
                                                            kst::Argument(outSize, "outSize"),
                                                        });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::size_t credentialSize = 0;
    err = GetSerializedCredentialSize(credential, &credentialSize);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(serializationContext(), err);
    }
    *outSize = kKSTHandleSize + credentialSize + sizeof(KSTScope);
    return kKSTErrorSuccess;
}

KSTStatus SerializeAddCredential(const KSTHandle* handle, const KSTCredential* credential,
                                 KSTScope scope, void* outBuffer, std::size_t* outSize) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = checkScope(handle, scope);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::requireArguments(context, {
                                             kst::Argument(credential, "credential"),
                                             kst::Argument(outBuffer, "outBuffer"),
                                             kst::Argument(outSize, "outSize"),
                                         });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    std::size_t requiredSize = 0;
    err = GetSerializedAddCredentialSize(handle, credential, scope, &requiredSize);
    err = kst::checkRoom(err, requiredSize, *outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    // Fits: the room was checked, and any payload is longer than a handle.
    base::ByteWriter front(outBuffer, kKSTHandleSize);
    static_cast<void>(kst::writeHandle(front, handle));
    auto* behindHandle = static_cast<std::uint8_t*>(outBuffer) + kKSTHandleSize;
    std::size_t credentialSize = *outSize - kKSTHandleSize;
    err = SerializeCredential(credential, behindHandle, &credentialSize);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    base::ByteWriter rest(behindHandle + credentialSize,
                          *outSize - kKSTHandleSize - credentialSize);
    if (!rest.writeU32(scope)) {
        return kst::failForRoom();
    }
    *outSize = kKSTHandleSize + credentialSize + rest.written();
    return kKSTErrorSuccess;
}

KSTStatus DeserializeAddCredential(const void* buffer, std::size_t size, KSTHandle* outHandle,
                                   KSTCredential** outCredential, KSTScope* outScope) noexcept {
    const kst::AssertionContext context = serializationContext();
    KSTStatus err = kst::requireArguments(context, {kst::Argument(buffer, "buffer")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (size < kSmallestSize) {
        return kst::fail(context,
                         "size >= sizeof(KSTHandle) + sizeof(KSTCredential) + sizeof(KSTScope)", 0,
                         kKSTErrorBadParameter);
    }
    err = kst::requireArguments(context, {
                                             kst::Argument(outHandle, "handle"),
                                             kst::Argument(outCredential, "credential"),
                                             kst::Argument(outScope, "scope"),
                                         });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteReader reader(buffer, size);
    static_cast<void>(kst::readHandle(reader, *outHandle));
    KSTCredential* credential = nullptr;
    std::size_t consumed = 0;
    err = DeserializeCredential(reader.rest().data(), reader.left(), &credential, &consumed);
    if (err != kKSTErrorSuccess) {
        return kst::failCall(context, err);
    }
    static_cast<void>(reader.skip(consumed));
    KSTScope scope = 0;
    if (!reader.readU32(scope)) {
        DeallocCredential(credential);
        return kst::fail(context, "size - offset >= sizeof(KSTScope)", 0, kKSTErrorBadParameter);
    }
    *outCredential = credential;
    *outScope = scope;
    return kKSTErrorSuccess;
}

KSTStatus GetSerializedRemoveCredentialSize(const KSTHandle* handle,
                                            const KSTCredential* credential, KSTScope scope,
                                            std::size_t* outSize) noexcept {
    return passUp(GetSerializedAddCredentialSize(handle, credential, scope, outSize));
}

KSTStatus SerializeRemoveCredential(const KSTHandle* handle, const KSTCredential* credential,
                                    KSTScope scope, void* outBuffer,
                                    std::size_t* outSize) noexcept {
    return passUp(SerializeAddCredential(handle, credential, scope, outBuffer, outSize));
}

KSTStatus DeserializeRemoveCredential(const void* buffer, std::size_t size, KSTHandle* outHandle,
                                      KSTCredential** outCredential, KSTScope* outScope) noexcept {
    return passUp(DeserializeAddCredential(buffer, size, outHandle, outCredential, outScope));
}

KSTStatus GetSerializedReplacePassphraseCredentialSize(const KSTHandle* handle,
                                                       const KSTCredential* credential,
                                                       KSTScope scope,
                                                       std::size_t* outSize) noexcept {
    return passUp(GetSerializedAddCredentialSize(handle, credential, scope, outSize));
}

KSTStatus SerializeReplacePassphraseCredential(const KSTHandle* handle,
                                               const KSTCredential* credential, KSTScope scope,
                                               void* outBuffer, std::size_t* outSize) noexcept {
    return passUp(SerializeAddCredential(handle, credential, scope, outBuffer, outSize));
}

KSTStatus DeserializeReplacePassphraseCredential(const void* buffer, std::size_t size,
                                                 KSTHandle* outHandle,
                                                 KSTCredential** outCredential,
                                                 KSTScope* outScope) noexcept {
    return passUp(DeserializeAddCredential(buffer, size, outHandle, outCredential, outScope));
}

namespace {

constexpr std::size_t kPropertyPayloadSize = kKSTHandleSize + sizeof(KSTContextProperty);

} // namespace

KSTStatus GetSerializedGetContextPropertySize(const KSTHandle* /*handle*/,
                                              KSTContextProperty /*property*/,
                                              std::size_t* outSize) noexcept {
    const KSTStatus err =
        kst::requireArguments(serializationContext(), {kst::Argument(outSize, "outSize")});
    if (err == kKSTErrorSuccess) {
        *outSize = kPropertyPayloadSize;
    }
    return err;
}

KSTStatus SerializeGetContextProperty(const KSTHandle* handle, KSTContextProperty property,
                                      void* outBuffer, std::size_t* outSize) noexcept {
    const KSTStatus err =
        kst::requireArguments(serializationContext(), {
                                                          kst::Argument(handle, "handle"),
                                                          kst::Argument(outBuffer, "outBuffer"),
                                                          kst::Argument(outSize, "outSize"),
                                                      });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (writer.left() < kPropertyPayloadSize || !kst::writeHandle(writer, handle) ||
        !writer.writeU32(property)) {
        return kst::failForRoom();
    }
    *outSize = writer.written();
    return kKSTErrorSuccess;
}

KSTStatus DeserializeGetContextProperty(const void* buffer, std::size_t size, KSTHandle* outHandle,
                                        KSTContextProperty* outProperty) noexcept {
    const KSTStatus err =
        kst::requireArguments(serializationContext(), {
                                                          kst::Argument(buffer, "buffer"),
                                                          kst::Argument(outHandle, "handle"),
                                                          kst::Argument(outProperty, "property"),
                                                      });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteReader reader(buffer, size);
    if (!kst::readHandle(reader, *outHandle)) {
        return kst::fail(serializationContext(), "(size - offset) >= sizeof(KSTHandle)", 0,
                         kKSTErrorBadParameter);
    }
    if (!reader.readU32(*outProperty)) {
        return kst::fail(serializationContext(), "(size - offset) >= sizeof(KSTContextProperty)", 0,
                         kKSTErrorBadParameter);
    }
    return kKSTErrorSuccess;
}
