#include "platform/fake/FakeKernel.h"

#include "base/Saturate.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace platform {

FakeStructAnswer FakeKernel::answer(const FakeStructCall& call) {
    structCalls.push_back(call);
    if (structAnswers.empty()) {
        return onStructCall ? onStructCall(call) : FakeStructAnswer();
    }
    FakeStructAnswer answer = std::move(structAnswers.front());
    structAnswers.pop_front();
    return answer;
}

FakeScalarAnswer FakeKernel::answer(const FakeScalarCall& call) {
    scalarCalls.push_back(call);
    if (scalarAnswers.empty()) {
        return {};
    }
    FakeScalarAnswer answer = std::move(scalarAnswers.front());
    scalarAnswers.pop_front();
    return answer;
}

ServiceHandle FakeServiceRegistry::findByPath(std::string_view path) {
    return kernel_.hasEntry() && path == kernel_.path ? hold() : kNoService;
}

ServiceHandle FakeServiceRegistry::findByClassName(std::string_view name) {
    return kernel_.hasEntry() && name == kernel_.className ? hold() : kNoService;
}

std::optional<std::vector<std::uint8_t>> FakeServiceRegistry::copyProperty(ServiceHandle entry,
                                                                           std::string_view name) {
    if (!kernel_.hasEntry() || pathOf(entry) != kernel_.path) {
        return std::nullopt;
    }
    kernel_.propertyReads.emplace_back(name);
    const auto found = kernel_.properties.find(name);
    return found == kernel_.properties.end() ? std::nullopt : std::optional(found->second);
}

void FakeServiceRegistry::release(ServiceHandle entry) {
    const auto found = entries_.find(entry);
    if (found != entries_.end() && --found->second.references == 0) {
        entries_.erase(found);
    }
}

std::size_t FakeServiceRegistry::liveReferences() const {
    std::size_t count = 0;
    for (const auto& [handle, entry] : entries_) {
        count += entry.references;
    }
    return count;
}

std::string FakeServiceRegistry::pathOf(ServiceHandle entry) const {
    const auto found = entries_.find(entry);
    return found == entries_.end() ? std::string() : found->second.path;
}

ServiceHandle FakeServiceRegistry::hold() {
    for (auto& [handle, entry] : entries_) {
        if (entry.path == kernel_.path) {
            ++entry.references;
            return handle;
        }
    }
    entries_.emplace(++lastHandle_, Entry{kernel_.path, 1});
    return lastHandle_;
}

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
