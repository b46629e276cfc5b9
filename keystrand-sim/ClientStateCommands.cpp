#include "base/Concat.h"
#include "keystrand-sim/ControlArguments.h"
#include "keystrand-sim/ControlCommand.h"
#include "wire/CredentialFields.h"

#include <algorithm>
#include <array>
#include <iterator>

namespace keystrand::sim {

namespace {

ControlOutcome contexts(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    for (const auto& [handle, entry] : context.kernel.contexts.all()) {
        outcome.lines.push_back(base::concat("context ", toHex(handle), " credentials ",
                                             entry.credentials.members().size(), " properties ",
                                             entry.properties.count()));
    }
    return outcome;
}

std::string describe(const CredentialSet::Member& member, ModelClock::Seconds now) {
    const KSTCredential& credential = *member.credential;
    std::string line = base::concat("credential type ", credential.type, " length ",
                                    wire::credentialSize(credential.dataLength), " user ");
    if (credential.userId == kKSTCredentialNoUser) {
        line += "none";
    } else {
        line += base::concat(credential.userId);
    }
    return base::concat(line, " age ", now - std::min(member.addedAt, now));
}

ControlOutcome list(const CredentialSet& credentials, ModelClock::Seconds now) {
    ControlOutcome outcome;
    for (const auto& member : credentials.members()) {
        outcome.lines.push_back(describe(member, now));
    }
    return outcome;
}

/// Of a context, or the global ones.
ControlOutcome credentials(ControlContext& context, ControlArguments& arguments) {
    const ModelClock::Seconds now = context.clock.now();
    if (!arguments.hasWord()) {
        const auto problem = arguments.problem();
        return problem ? ControlOutcome::failed(*problem)
                       : list(context.kernel.globalCredentials, now);
    }
    const auto bytes = arguments.bytes("context");
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    KSTHandle handle{};
    if (bytes.size() != sizeof handle.bytes) {
        return ControlOutcome::failed("context: not 16 bytes");
    }
    std::copy(bytes.begin(), bytes.end(), std::begin(handle.bytes));
    const Context* found = context.kernel.contexts.find(handle);
    return found == nullptr ? ControlOutcome::failed("absent") : list(found->credentials, now);
}

ControlOutcome policies(ControlContext& context, ControlArguments& arguments) {
    if (const auto problem = arguments.problem()) {
        return ControlOutcome::failed(*problem);
    }
    ControlOutcome outcome;
    for (const auto& [name, requirement] : context.kernel.policies.all()) {
        outcome.lines.push_back(base::concat("policy ", name, " = ", toText(requirement)));
    }
    return outcome;
}

ControlOutcome outcomeOf(const std::optional<std::string>& problem) {
    return problem ? ControlOutcome::failed(*problem) : ControlOutcome::done();
}

ControlOutcome loadPolicies(ControlContext& context, ControlArguments& arguments) {
    const std::string path(arguments.word("file"));
    const auto problem = arguments.problem();
    return outcomeOf(problem ? problem : context.kernel.policies.load(path));
}

ControlOutcome reloadPolicies(ControlContext& context, ControlArguments& arguments) {
    const auto problem = arguments.problem();
    return outcomeOf(problem ? problem : context.kernel.policies.reload());
}

constexpr std::array kCommands = {
    ControlCommand{"contexts", "", contexts},
    ControlCommand{"credentials", "[CONTEXT]", credentials},
    ControlCommand{"policies load", "FILE", loadPolicies},
    ControlCommand{"policies reload", "", reloadPolicies},
    ControlCommand{"policies", "", policies},
};

} // namespace

std::span<const ControlCommand> clientStateCommands() {
    return kCommands;
}

} // namespace keystrand::sim
