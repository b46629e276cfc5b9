#include "KSTLib/CredentialSerialization.h"
#include "common/AssertLine.h"
#include "common/HandleWire.h"
#include "common/SerializationContext.h"
#include "common/WriterRoom.h"

namespace {

using kst::serializationContext;

constexpr std::size_t kSize = kKSTHandleSize + sizeof(KSTContextProperty);

} // namespace

KSTStatus GetSerializedGetContextPropertySize(const KSTHandle* /*handle*/,
                                              KSTContextProperty /*property*/,
                                              std::size_t* outSize) noexcept {
    const KSTStatus err =
        serializationContext().requireArguments({kst::Argument(outSize, "outSize")});
    if (err == kKSTErrorSuccess) {
        *outSize = kSize;
    }
    return err;
}

KSTStatus SerializeGetContextProperty(const KSTHandle* handle, KSTContextProperty property,
                                      void* outBuffer, std::size_t* outSize) noexcept {
    const KSTStatus err = serializationContext().requireArguments({
        kst::Argument(handle, "handle"),
        kst::Argument(outBuffer, "outBuffer"),
        kst::Argument(outSize, "outSize"),
    });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    base::ByteWriter writer(outBuffer, *outSize);
    if (writer.left() < kSize || !kst::writeHandle(writer, handle) || !writer.writeU32(property)) {
        return kst::failForRoom();
    }
    *outSize = writer.written();
    return kKSTErrorSuccess;
}

KSTStatus DeserializeGetContextProperty(const void* buffer, std::size_t size, KSTHandle* outHandle,
                                        KSTContextProperty* outProperty) noexcept {
    const KSTStatus err = serializationContext().requireArguments({
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
