#include "KSTLib/Command.h"
#include "keystrand/Commands.h"

#include <iterator>

namespace keystrand {

namespace {

using Payload = std::span<const std::uint8_t>;

/// Codes of this program's own; the library sends neither.
constexpr std::uint32_t kGetContextProperty = 21;
constexpr std::uint32_t kSetContextProperty = 22;

constexpr std::size_t kPropertyPayloadSize = kKSTHandleSize + sizeof(KSTContextProperty);
constexpr std::size_t kLogLevelSize = 1;
constexpr std::size_t kExistsSize = sizeof(std::uint32_t);
constexpr DispatchTable::Lengths kHandleAlone{.min = kKSTHandleSize, .max = kKSTHandleSize};

CommandResult create(KernelState& kernel) {
    const auto handle = kernel.contexts.create();
    if (!handle) {
        return endedWith(kKernelTooManyContexts);
    }
    CommandResult result;
    result.output.assign(std::begin(handle->bytes), std::end(handle->bytes));
    result.output.push_back(kernel.logLevel);
    return result;
}

CommandResult destroy(KernelState& kernel, Payload payload) {
    const bool wasThere = kernel.contexts.destroy(HandlePayload(payload).handle);
    return endedWith(wasThere ? kKernelSuccess : kKernelNoSuchContext);
}

CommandResult createWithExternalForm(KernelState& kernel, Payload payload) {
    CommandResult result =
        answeredWith(kernel.contexts.find(HandlePayload(payload).handle) != nullptr);
    result.output.push_back(kernel.logLevel);
    return result;
}

CommandResult getExternalForm(KernelState& kernel, Payload payload) {
    const bool exists = kernel.contexts.find(HandlePayload(payload).handle) != nullptr;
    return endedWith(exists ? kKernelSuccess : kKernelNoSuchContext);
}

CommandResult getProperty(KernelState& kernel, Payload payload) {
    HandlePayload fields(payload);
    const KSTContextProperty property = fields.number();
    const Context* context = kernel.contexts.find(fields.handle);
    if (context == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    const auto value = context->properties.get(property);
    return {.status = kKernelSuccess, .output = {value.begin(), value.end()}};
}

CommandResult setProperty(KernelState& kernel, Payload payload) {
    HandlePayload fields(payload);
    const KSTContextProperty property = fields.number();
    Context* context = kernel.contexts.find(fields.handle);
    if (context == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    const bool isSet = context->properties.set(property, fields.rest.rest());
    return endedWith(isSet ? kKernelSuccess : kKernelTableFull);
}

} // namespace

void addContextCommands(DispatchTable& table, KernelState& kernel) {
    table.add(kKSTCommandContextCreate,
              {.min = 0, .max = 0, .output = kKSTHandleSize + kLogLevelSize},
              [&](Payload /*payload*/) { return create(kernel); });
    table.add(kKSTCommandContextDelete, kHandleAlone,
              [&](Payload payload) { return destroy(kernel, payload); });
    table.add(kKSTCommandContextCreateWithExternalForm,
              {.min = kKSTHandleSize, .max = kKSTHandleSize, .output = kExistsSize + kLogLevelSize},
              [&](Payload payload) { return createWithExternalForm(kernel, payload); });
    table.add(kKSTCommandContextGetExternalForm, kHandleAlone,
              [&](Payload payload) { return getExternalForm(kernel, payload); });
    table.add(kGetContextProperty, {.min = kPropertyPayloadSize, .max = kPropertyPayloadSize},
              [&](Payload payload) { return getProperty(kernel, payload); });
    table.add(
        kSetContextProperty,
        {.min = kPropertyPayloadSize, .max = kPropertyPayloadSize + NumberedValues::kMaxValueSize},
        [&](Payload payload) { return setProperty(kernel, payload); });
}

} // namespace keystrand
