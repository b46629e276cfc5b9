#include "platform/fake/FakeKernelChannel.h"

#include "base/Saturate.h"

#include <algorithm>
#include <cerrno>

namespace platform {

namespace {

/// The kernel side's own word for a call on an entry that is gone.
constexpr Status kNoSuchEntry = -6002;

/// Tells of a reply that is larger than was offered, and nothing else of it.
template <typename Size>
Status handOutSize(std::size_t reported, Size* size) {
    if (size == nullptr) {
        return statusFromErrno(EMSGSIZE);
    }
    *size = base::saturate<Size>(reported);
    return kSuccess;
}

} // namespace

Status FakeKernelChannel::open(ServiceHandle service, std::uint32_t connectionType,
                               ConnectionHandle* connection) {
    const std::string path = registry_.pathOf(service);
    if (path.empty()) {
        return statusFromErrno(ENOENT);
    }
    if (kernel_.absence != 0) {
        return statusFromErrno(kernel_.absence);
    }
    kernel_.opens.push_back({path, connectionType});
    if (!kernel_.entryPresent) {
        return kNoSuchEntry;
    }
    if (kernel_.openStatus == kSuccess) {
        *connection = ++lastConnection_;
    }
    return kernel_.openStatus;
}

Status FakeKernelChannel::structCall(ConnectionHandle connection, std::uint32_t selector,
                                     const void* input, std::size_t inputSize, void* output,
                                     std::size_t* outputSize) {
    if (inputSize > kMaxStructInput) {
        return statusFromErrno(EMSGSIZE);
    }
    if (const Status status = reach(connection); status != kSuccess) {
        return status;
    }
    const std::size_t offered = outputSize == nullptr ? 0 : *outputSize;
    if (offered > 0 && output == nullptr) {
        return statusFromErrno(EINVAL);
    }
    FakeStructCall call{connection, selector, {}, offered};
    const auto* const bytes = static_cast<const std::uint8_t*>(input);
    call.input.assign(bytes, bytes + inputSize);
    FakeStructAnswer answer = kernel_.answer(call);
    if (answer.status != kSuccess) {
        return answer.status;
    }
    const std::size_t reported = answer.reportedSize.value_or(answer.output.size());
    if (reported > offered) {
        return handOutSize(reported, outputSize);
    }
    answer.output.resize(reported);
    std::copy(answer.output.begin(), answer.output.end(), static_cast<std::uint8_t*>(output));
    if (outputSize != nullptr) {
        *outputSize = reported;
    }
    return kSuccess;
}

Status FakeKernelChannel::scalarCall(ConnectionHandle connection, std::uint32_t selector,
                                     const std::uint64_t* inputs, std::uint32_t inputCount,
                                     std::uint64_t* outputs, std::uint32_t* outputCount) {
    const std::uint32_t offered = outputCount == nullptr ? 0 : *outputCount;
    if (inputCount > kMaxScalars || offered > kMaxScalars) {
        return statusFromErrno(E2BIG);
    }
    if (const Status status = reach(connection); status != kSuccess) {
        return status;
    }
    const FakeScalarAnswer answer = kernel_.answer(
        FakeScalarCall{connection, selector, {inputs, inputs + inputCount}, offered});
    if (answer.status != kSuccess) {
        return answer.status;
    }
    if (answer.outputs.size() > offered) {
        return handOutSize(answer.outputs.size(), outputCount);
    }
    std::copy(answer.outputs.begin(), answer.outputs.end(), outputs);
    if (outputCount != nullptr) {
        *outputCount = static_cast<std::uint32_t>(answer.outputs.size());
    }
    return kSuccess;
}

Status FakeKernelChannel::reach(ConnectionHandle connection) const {
    if (connection == kNoConnection || connection > lastConnection_) {
        return statusFromErrno(EBADF);
    }
    return kernel_.absence == 0 ? kSuccess : statusFromErrno(kernel_.absence);
}

} // namespace platform
