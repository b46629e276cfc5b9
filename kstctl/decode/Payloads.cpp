#include "kstctl/decode/Payloads.h"

#include "KSTLib/Command.h"
#include "base/Concat.h"

#include <algorithm>
#include <iterator>

namespace kstctl::decode {

namespace {

constexpr CommandPayload kCommands[] = {
    {kKSTCommandContextCreate, "create-context", decodeNoPayload},
    {kKSTCommandContextDelete, "delete-context", decodeHandle},
    {kKSTCommandVerifyPolicy, "verify-policy", decodeVerifyPolicy},
    {kKSTCommandContainsCredentialType, "contains-credential-type", decodeContainsCredentialType},
    {kKSTCommandAddCredential, "add-credential", decodeCredentialCommand},
    {kKSTCommandRemoveCredentialsByValue, "remove-credentials-by-value", decodeCredentialCommand},
    {kKSTCommandRemoveCredentialsByType, "remove-credentials-by-type",
     decodeRemoveCredentialsByType},
    {kKSTCommandVerifyAclConstraint, "verify-acl-constraint", decodeVerifyAclConstraint},
    {kKSTCommandContainsPassphraseCredential, "contains-passphrase", decodeContainsPassphrase},
    {kKSTCommandReplacePassphraseCredentials, "replace-passphrases", decodeCredentialCommand},
    {kKSTCommandRemovePassphraseCredentials, "remove-passphrases", decodeRemovePassphrases},
    {kKSTCommandContextCreateWithExternalForm, "open-external-form", decodeHandle},
    {kKSTCommandContextGetExternalForm, "get-external-form", decodeHandle},
    {kKSTCommandParseAcl, "parse-acl", decodeProcessAcl},
    {kKSTCommandSetEnvironmentVariable, "set-environment-variable", decodeSetEnvironmentVariable},
    {kKSTCommandGetEnvironmentVariable, "get-environment-variable", decodeGetEnvironmentVariable},
    {kKSTCommandKernelControl, "kernel-control", decodeKernelControl},
};

template <typename Matches>
const CommandPayload* findWhere(Matches matches) {
    const auto* const found = std::find_if(std::begin(kCommands), std::end(kCommands), matches);
    return found != std::end(kCommands) ? found : nullptr;
}

} // namespace

std::span<const CommandPayload> commandPayloads() {
    return kCommands;
}

const CommandPayload* findCommand(std::uint32_t code) {
    return findWhere([code](const CommandPayload& command) { return command.code == code; });
}

const CommandPayload* findCommand(std::string_view nameOrCode) {
    return findWhere([nameOrCode](const CommandPayload& command) {
        return command.name == nameOrCode || base::concat(command.code) == nameOrCode;
    });
}

} // namespace kstctl::decode
