#include "KSTLib/Command.h"
#include "KSTLib/ProcessAclSerialization.h"
#include "base/ByteWriter.h"
#include "keystrand/Characteristics.h"
#include "keystrand/Commands.h"
#include "keystrand/Constraint.h"
#include "keystrand/Received.h"

#include <cassert>

namespace keystrand {

namespace {

using Payload = std::span<const std::uint8_t>;

constexpr std::size_t kMaxOperationSize = 256;
/// Without the list, the operation and parameters.
constexpr std::size_t kMinPayload = kKSTHandleSize + 4 * sizeof(std::uint32_t);

struct Request {
    KSTHandle handle{};
    ReceivedText acl;
    ReceivedText operation;
    std::uint32_t maxGlobalAge = 0;
    ReceivedParameters parameters;

    [[nodiscard]] std::size_t wireSize() const {
        return kMinPayload + acl.length + operation.length + parameters.wireSize();
    }
};

/// False for a payload that is not exactly such a request.
bool read(Payload payload, Request& request) {
    const KSTStatus status = DeserializeProcessAcl(
        payload.data(), static_cast<std::uint32_t>(payload.size()), &request.handle,
        &request.acl.data, &request.acl.length, &request.operation.data, &request.operation.length,
        &request.maxGlobalAge, &request.parameters.items, &request.parameters.count);
    return status == kKSTErrorSuccess && payload.size() == request.wireSize() &&
           request.acl.length <= kMaxConstraintSize &&
           request.operation.length <= kMaxOperationSize && !request.parameters.disagreeAboutUser();
}

std::vector<std::uint8_t> encode(const std::vector<Characteristics>& all) {
    std::vector<std::uint8_t> bytes(sizeof(std::uint32_t) * (1 + 2 * all.size()));
    base::ByteWriter writer(bytes);
    [[maybe_unused]] bool fits = writer.writeU32(static_cast<std::uint32_t>(all.size()));
    for (const Characteristics& one : all) {
        fits = fits && writer.writeU32(one.usable) && writer.writeU32(one.indispensable);
    }
    assert(fits);
    return bytes;
}

/// Of the rules for `operation`, or of all of them when it is empty.
CommandResult describe(const std::vector<AccessRule>& rules, std::string_view operation,
                       const PolicyTable& policies) {
    std::vector<Characteristics> all;
    for (const AccessRule& rule : rules) {
        if (!operation.empty() && rule.operation != operation) {
            continue;
        }
        const Requirement* requirement = resolve(rule.constraint, policies);
        if (requirement == nullptr) {
            return endedWith(kKernelNoSuchPolicy);
        }
        all.push_back(characteristicsOf(*requirement));
    }
    return {.status = kKernelSuccess, .output = encode(all)};
}

CommandResult parseAcl(KernelState& kernel, Payload payload) {
    Request request;
    if (!read(payload, request)) {
        return endedWith(kKernelBadPayload);
    }
    if (!isNoHandle(request.handle) && kernel.contexts.find(request.handle) == nullptr) {
        return endedWith(kKernelNoSuchContext);
    }
    TextParser parser(request.acl.view());
    const auto rules = parseAccessList(parser);
    if (!rules) {
        return endedWith(kKernelBadConstraint);
    }
    return describe(*rules, request.operation.view(), kernel.policies);
}

} // namespace

void addAccessListCommand(DispatchTable& table, KernelState& kernel) {
    table.add(kKSTCommandParseAcl,
              {.min = kMinPayload,
               .max = kMinPayload + kMaxConstraintSize + kMaxOperationSize +
                      ReceivedParameters::kMaxWireSize},
              [&](Payload payload) { return parseAcl(kernel, payload); });
}

} // namespace keystrand
