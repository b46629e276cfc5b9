#include "bench/codec/Samples.h"

#include "KSTLib/RequirementSerialization.h"
#include "base/Concat.h"

#include <cstring>
#include <numeric>
#include <stdexcept>
#include <string_view>

namespace bench {

namespace {

Bytes countedUp(std::size_t size) {
    Bytes bytes(size);
    std::iota(bytes.begin(), bytes.end(), std::uint8_t{1});
    return bytes;
}

SampleRequirement leaf(std::uint32_t type, std::size_t dataSize) {
    return {.type = type, .state = 1, .priority = 2, .data = countedUp(dataSize)};
}

SampleRequirement composite(std::uint32_t type, std::vector<SampleRequirement> children) {
    return {.type = type,
            .state = 1,
            .priority = 3,
            .k = type == kKSTRequirementTypeKofN ? 2U : 0U,
            .children = std::move(children)};
}

void append(Bytes& bytes, std::uint32_t value) {
    const std::size_t end = bytes.size();
    bytes.resize(end + sizeof value);
    std::memcpy(&bytes[end], &value, sizeof value);
}

void append(Bytes& bytes, const SampleRequirement& requirement) {
    const bool isKofN = requirement.type == kKSTRequirementTypeKofN;
    const bool isComposite = isKofN || !requirement.children.empty();
    const auto count = static_cast<std::uint32_t>(requirement.children.size());
    append(bytes, requirement.type);
    append(bytes, requirement.state);
    append(bytes, requirement.priority);
    append(bytes, isComposite ? (isKofN ? 8 : 4) + 8 * count
                              : static_cast<std::uint32_t>(requirement.data.size()));
    if (isKofN) {
        append(bytes, requirement.k);
    }
    if (isComposite) {
        append(bytes, count);
    }
    bytes.insert(bytes.end(), requirement.data.begin(), requirement.data.end());
    for (const SampleRequirement& child : requirement.children) {
        append(bytes, child);
    }
}

} // namespace

SampleCredential sampleCredential() {
    SampleCredential credential{
        .header = {.type = kKSTCredentialTypePassphraseEntered,
                   .word4 = 1,
                   .word8 = 0,
                   .userId = 501,
                   .word16 = 0x0123456789abcdef,
                   .word24 = 7,
                   .dataLength = sizeof(KSTCredentialDataPassphraseEntered)},
        .data = {.purpose = 2, .passphraseLength = kKSTPassphraseMaxLength, .passphrase = {}}};
    const Bytes passphrase = countedUp(kKSTPassphraseMaxLength);
    std::memcpy(credential.data.passphrase, passphrase.data(), passphrase.size());
    return credential;
}

SampleRequirement sampleRequirement() {
    const SampleRequirement passcode = leaf(kKSTRequirementTypePasscodeValidated, 4);
    const SampleRequirement passphrase = leaf(kKSTRequirementTypePassphraseEntered, 4);
    const SampleRequirement biometry = leaf(kKSTRequirementTypeBiometryMatched, 68);
    const SampleRequirement output = leaf(kKSTRequirementTypeUserOutputDisplayed, 32);
    const SampleRequirement marker = leaf(8, 0);
    const SampleRequirement all =
        composite(kKSTRequirementTypeAnd, {passcode, biometry, marker, passphrase});
    const SampleRequirement any =
        composite(kKSTRequirementTypeOr, {passcode, biometry, output, marker});
    return composite(kKSTRequirementTypeAnd,
                     {composite(kKSTRequirementTypeOr, {passcode, biometry, passphrase, all}),
                      composite(kKSTRequirementTypeKofN, {passcode, marker, output, any}),
                      passphrase});
}

SampleQuestion sampleQuestion() {
    SampleQuestion question{.handle = {},
                            .policy = "com.example.storage.unlock",
                            .preflight = true,
                            .maxGlobalCredentialAge = 300,
                            .parameters = {}};
    const Bytes handle = countedUp(kKSTHandleSize);
    std::memcpy(question.handle.bytes, handle.data(), handle.size());
    question.parameters = {{1, countedUp(4)},  {2, countedUp(16)}, {3, countedUp(64)},
                           {4, countedUp(4)},  {5, countedUp(4)},  {6, countedUp(16)},
                           {7, countedUp(16)}, {3, countedUp(20)}, {1, countedUp(4)},
                           {2, countedUp(16)}};
    return question;
}

void DeallocTree::operator()(KSTRequirement* tree) const {
    DeallocRequirement(tree);
}

Bytes wireBytes(const SampleRequirement& requirement) {
    Bytes bytes;
    append(bytes, requirement);
    return bytes;
}

Tree treeOf(const Bytes& bytes) {
    KSTRequirement* tree = nullptr;
    std::size_t consumed = 0;
    const KSTStatus status = DeserializeRequirement(bytes.data(), bytes.size(), &tree, &consumed);
    if (status != kKSTErrorSuccess) {
        throw std::runtime_error(base::concat("a sample cannot be read, status ", status));
    }
    return Tree(tree);
}

} // namespace bench
