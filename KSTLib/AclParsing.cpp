#include "KSTLib/Channel.h"
#include "KSTLib/Command.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/LibrarySender.h"
#include "KSTLib/PolicyVerification.h"
#include "KSTLib/RequestSerialization.h"
#include "common/Allocation.h"
#include "common/BuiltPayload.h"
#include "common/RequiredFunction.h"

#include <cstring>
#include <limits>
#include <optional>

namespace {

constexpr std::size_t kMaxCharacteristicsSize = 4096;

/// The reply, as the block is to see it: its size stays the one that was offered until there is
/// one.
struct Characteristics {
    std::optional<kst::AllocatedMemory> output;
    std::size_t outputSize = kMaxCharacteristicsSize;
};

KSTStatus checkArguments(const void* acl, std::size_t aclLength, const KSTStatusDataBlock& block) {
    const kst::AssertionContext context = kst::libraryContext();
    if (acl == nullptr || aclLength == 0) {
        return kst::fail(context, "acl && aclLength", 0, kKSTErrorBadParameter);
    }
    const KSTStatus err = kst::requireBlock(context, block, "processConstraintCharacteristics");
    if (err == kKSTErrorSuccess && aclLength > std::numeric_limits<std::uint32_t>::max()) {
        return kst::fail(context, "aclLength <= UINT32_MAX", 0, kKSTErrorBadParameter);
    }
    return err;
}

/// Sends the payload and keeps a copy of the reply of exactly its size.
KSTStatus sendAcl(const kst::BuiltPayload& payload, Characteristics& result) {
    const kst::AllocatedMemory outputBuffer(kMaxCharacteristicsSize);
    if (outputBuffer.bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "outputBuffer", 0, kKSTErrorOutOfMemory);
    }
    const KSTStatus err =
        kst::librarySender().send(kKSTCommandParseAcl, payload.bytes(), payload.size(),
                                  outputBuffer.bytes(), &result.outputSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    result.output.emplace(result.outputSize);
    if (result.output->bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "output", 0, kKSTErrorOutOfMemory);
    }
    std::memcpy(result.output->bytes(), outputBuffer.bytes(), result.outputSize);
    return kKSTErrorSuccess;
}

KSTStatus parseAcl(const void* acl, std::uint32_t aclLength, Characteristics& result) {
    KSTStatus err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::BuiltPayload payload;
    err = payload.build<std::uint32_t>(
        kst::libraryContext(),
        [&](std::uint32_t* size) {
            return GetSerializedProcessAclSize(nullptr, acl, aclLength, nullptr, 0, 0, nullptr, 0,
                                               size);
        },
        [&](void* buffer, std::uint32_t* size) {
            return SerializeProcessAcl(nullptr, acl, aclLength, nullptr, 0, 0, nullptr, 0, buffer,
                                       size);
        });
    return err != kKSTErrorSuccess ? err : sendAcl(payload, result);
}

} // namespace

KSTStatus KSTParseAclAndCopyConstraintCharacteristics(
    const void* acl, std::size_t aclLength,
    KSTStatusDataBlock processConstraintCharacteristics) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    const KSTStatusDataBlock& block = processConstraintCharacteristics;
    Characteristics result;
    KSTStatus err = checkArguments(acl, aclLength, block);
    if (err == kKSTErrorSuccess) {
        err = parseAcl(acl, static_cast<std::uint32_t>(aclLength), result);
    }
    if (block.invoke != nullptr) {
        const bool isThere = err == kKSTErrorSuccess && result.outputSize > 0;
        block.invoke(block.captured, err, isThere ? result.output->bytes() : nullptr,
                     result.outputSize);
    }
    return kst::logReturning(__func__, err);
}
