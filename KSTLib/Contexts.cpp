#include "KSTLib/Contexts.h"

#include "KSTLib/Channel.h"
#include "KSTLib/Command.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/LibrarySender.h"
#include "KSTLib/Platform.h"
#include "common/Allocation.h"
#include "common/ContextObject.h"
#include "common/Failure.h"

#include <algorithm>

namespace {

constexpr std::size_t kCreateReplySize = kKSTHandleSize + sizeof(std::uint8_t);
constexpr const char* kDeleteFunction = "KSTContextDelete";
constexpr std::size_t kOpenReplySize = sizeof(std::uint32_t) + sizeof(std::uint8_t);

/// What every function of the family does with a failure.
KSTStatus logContextReturning(const char* function, KSTStatus err) {
    if (err != kKSTErrorSuccess) {
        kst::updateLogLevelIfOpen();
    }
    return kst::logReturning(function, err);
}

/// Asks for a new context into `reply`, which becomes the context itself.
KSTStatus requestContext(std::uint8_t* reply) {
    std::size_t outSize = kCreateReplySize;
    const KSTStatus err =
        kst::librarySender().send(kKSTCommandContextCreate, nullptr, 0, reply, &outSize);
    if (err == kKSTErrorSuccess && outSize != kCreateReplySize) {
        return kst::fail(kst::libraryContext(), "outSize == sizeof(KSTHandle) + sizeof(uint8_t)", 0,
                         kKSTErrorUnexpected);
    }
    return err;
}

KSTStatus create(const char* function, KSTContextRef* context) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(context, "context")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::AllocatedMemory ref(kCreateReplySize);
    if (ref.bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "ref", 0, kKSTErrorOutOfMemory);
    }
    err = requestContext(ref.bytes());
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::gLogLevel = ref.bytes()[kKSTHandleSize];
    kst::logLevelSet(function);
    // The reply is the context: a handle, and one byte more that nobody looks at again.
    *context = reinterpret_cast<KSTContext*>(ref.handOut());
    return kKSTErrorSuccess;
}

/// Reads the reply to the external form: whether there is such a context, and the log level. It is
/// looked at where it is, byte by byte, so that no copy of it stays on the stack.
KSTStatus readOpenReply(const kst::AllocatedMemory& reply, const void* externalForm,
                        KSTContextRef& context) {
    const std::uint8_t* const exists = reply.bytes();
    const std::uint8_t* const level = exists + sizeof(std::uint32_t);
    if (std::any_of(exists, level, [](std::uint8_t byte) { return byte != 0; })) {
        context = kst::makeContext(externalForm);
        if (context == nullptr) {
            return kst::fail(kst::libraryContext(), "ref", 0, kKSTErrorOutOfMemory);
        }
    }
    kst::gLogLevel = *level;
    return kKSTErrorSuccess;
}

KSTStatus open(const void* externalForm, std::size_t dataLength, KSTContextRef& context) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(externalForm, "externalForm")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (dataLength != kKSTHandleSize) {
        return kst::fail(kst::libraryContext(), "dataLength == sizeof(KSTHandle)", 0,
                         kKSTErrorBadParameter);
    }
    err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    const kst::AllocatedMemory outBuffer(kOpenReplySize);
    if (outBuffer.bytes() == nullptr) {
        return kst::fail(kst::libraryContext(), "outBuffer", 0, kKSTErrorOutOfMemory);
    }
    std::size_t outSize = outBuffer.size();
    err = kst::librarySender().send(kKSTCommandContextCreateWithExternalForm, externalForm,
                                    dataLength, outBuffer.bytes(), &outSize);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (outSize != outBuffer.size()) {
        return kst::fail(kst::libraryContext(), "outSize == sizeof(uint32_t) + sizeof(uint8_t)", 0,
                         kKSTErrorUnexpected);
    }
    return readOpenReply(outBuffer, externalForm, context);
}

/// Sends a command whose payload is the handle.
KSTStatus sendHandle(std::uint32_t code, KSTContextRef context) {
    const KSTStatus err = kst::openChannel();
    if (err != kKSTErrorSuccess) {
        return err;
    }
    return kst::librarySender().send(code, context->handle.bytes, kKSTHandleSize, nullptr, nullptr);
}

KSTStatus deleteContextInternal(KSTContextRef context, bool destroy) {
    KSTStatus err =
        kst::requireArguments(kst::libraryContext(), {kst::Argument(context, "context")});
    if (err != kKSTErrorSuccess) {
        return err;
    }
    if (destroy) {
        err = sendHandle(kKSTCommandContextDelete, context);
    }
    if (err != kKSTErrorSuccess) {
        return err;
    }
    kst::disposeOfContext(context);
    return kKSTErrorSuccess;
}

KSTStatus getExternalForm(KSTContextRef context, const KSTDataBlock& processExternalForm) {
    KSTStatus err = kst::requireArguments(
        kst::libraryContext(), {
                                   kst::Argument(context, "context"),
                                   kst::Argument(processExternalForm, "processExternalForm"),
                               });
    if (err != kKSTErrorSuccess) {
        return err;
    }
    err = sendHandle(kKSTCommandContextGetExternalForm, context);
    if (err != kKSTErrorSuccess) {
        return err;
    }
    processExternalForm.invoke(processExternalForm.captured, context->handle.bytes, kKSTHandleSize);
    return kKSTErrorSuccess;
}

} // namespace

namespace kst {

KSTStatus createContext(KSTContextRef* context) noexcept {
    constexpr const char* kFunction = "KSTContextCreate";
    logCalled(kFunction);
    return logContextReturning(kFunction, create(kFunction, context));
}

KSTStatus deleteContext(KSTContextRef context, bool destroy) noexcept {
    logCalled(kDeleteFunction);
    return logContextReturning(kDeleteFunction, deleteContextInternal(context, destroy));
}

KSTStatus postContextDelete(KSTContextRef context) noexcept {
    logCalled(kDeleteFunction);
    const KSTStatus err =
        postCommand(kKSTCommandContextDelete, context->handle.bytes, kKSTHandleSize);
    if (err == kKSTErrorSuccess) {
        disposeOfContext(context);
    }
    return logReturning(kDeleteFunction, err);
}

TemporaryContext::~TemporaryContext() {
    if (context_ == nullptr) {
        return;
    }
    KSTStatus err = kKSTErrorUnexpected;
    if (process_ == processNumber()) {
        err = isTimeUp() ? postContextDelete(context_) : deleteContext(context_, true);
    }
    if (err != kKSTErrorSuccess) {
        static_cast<void>(deleteContext(context_, false));
    }
}

KSTStatus TemporaryContext::create(CheckPlace place) noexcept {
    process_ = processNumber();
    const KSTStatus err = createContext(&context_);
    return err == kKSTErrorSuccess ? err : failCall(libraryContext(), err, place);
}

} // namespace kst

KSTStatus KSTContextCreate(KSTContextRef* context) noexcept {
    const kst::CallScope call;
    return kst::createContext(context);
}

KSTContextRef KSTContextCreateWithExternalForm(const void* externalForm,
                                               std::size_t dataLength) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    KSTContextRef context = nullptr;
    const KSTStatus err = open(externalForm, dataLength, context);
    if (err != kKSTErrorSuccess) {
        kst::updateLogLevelIfOpen();
    }
    kst::logReturningReference(__func__, err, context);
    return context;
}

KSTStatus KSTContextDelete(KSTContextRef context, bool destroy) noexcept {
    const kst::CallScope call;
    return kst::deleteContext(context, destroy);
}

void KSTContextGetExternalForm(KSTContextRef context, KSTDataBlock processExternalForm) noexcept {
    const kst::CallScope call;
    kst::logCalled(__func__);
    logContextReturning(__func__, getExternalForm(context, processExternalForm));
}
